// Tells when files of a folder were removed, moved away or replaced.
//
// For files that somebody keeps open: what is written to them goes nowhere from then on,
// and who has nothing to write would not notice. Costs nothing while nothing happens. It
// waits a moment, because who removes one file usually removes several.
//
// Construction, destruction and the callback are on the thread that runs the io_context.
#pragma once

#include <asio/io_context.hpp>
#include <asio/posix/stream_descriptor.hpp>
#include <asio/steady_timer.hpp>
#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

namespace halyard::linux_ {

class RemovalWatch {
public:
    static constexpr std::chrono::milliseconds kSettleTime{200};

    // Of files whose names begin with `prefix`. Where the system has no watch to give, a
    // log line says so and nothing is ever told. Borrows `context`.
    RemovalWatch(asio::io_context& context, const std::filesystem::path& folder,
                 std::string_view prefix, std::function<void()> removed,
                 std::chrono::milliseconds settleTime = kSettleTime);

private:
    void awaitEvents();
    // Whether one of them is of a file that matters.
    bool readEvents();
    void tellWhenSettled();

    const std::string prefix_;
    const std::function<void()> removed_;
    const std::chrono::milliseconds settleTime_;
    asio::posix::stream_descriptor events_;
    asio::steady_timer settled_;
    // Completions that come after destruction find it gone.
    const std::shared_ptr<const int> alive_ = std::make_shared<const int>(0);
};

} // namespace halyard::linux_
