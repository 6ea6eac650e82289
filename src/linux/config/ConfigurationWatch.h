// Tells when the configuration file, or one of its drop-ins, may have changed.
//
// Watches the directory, because editors replace files instead of writing them;
// while the directory is missing, the nearest one above it. The folder of the drop-ins
// in it has a watch of its own, when it is there. A file that is
// written or moved into place is told at once. One that is gone, or has only
// been created, is given a moment first: editors move the old file away before
// they write the new one, and what lies between is nobody's intention.
//
// Construction, destruction and the callback are on the thread that runs the
// io_context. Changes of a file that a link in a directory points to, and of
// directories further up, are not seen: that is what SIGHUP is for.
#pragma once

#include <asio/io_context.hpp>
#include <asio/posix/stream_descriptor.hpp>
#include <asio/steady_timer.hpp>
#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

struct inotify_event;

namespace halyard::linux_ {

class ConfigurationWatch {
public:
    static constexpr std::chrono::milliseconds kSettleTime{200};

    // `changed` runs once for all that one turn of the loop brings. Borrows
    // `context`. Where the system has no watch to give, a log line says so and
    // nothing is ever told. Requires an absolute `directory`.
    ConfigurationWatch(asio::io_context& context, std::filesystem::path directory,
                       std::string_view fileName, std::string_view dropInFolder,
                       std::function<void()> changed,
                       std::chrono::milliseconds settleTime = kSettleTime);
    ~ConfigurationWatch();
    ConfigurationWatch(const ConfigurationWatch&) = delete;
    ConfigurationWatch& operator=(const ConfigurationWatch&) = delete;

private:
    void arm();
    bool watchNearest();
    void watchDropIns();
    void awaitEvents();
    void readEvents();
    void handle(const inotify_event& event);
    void handleNearest(const inotify_event& event);
    void handleDropIn(const inotify_event& event);
    void tell(std::uint32_t what);
    void tellSoon();
    void tellWhenSettled();

    asio::io_context& context_;
    const std::filesystem::path directory_;
    const std::string fileName_;
    const std::string dropInFolder_;
    const std::function<void()> changed_;
    const std::chrono::milliseconds settleTime_;
    asio::posix::stream_descriptor events_;
    asio::steady_timer settled_;
    int watch_ = -1;
    int dropInWatch_ = -1;
    std::filesystem::path watched_; // directory_ or one above it
    std::string awaited_;           // the name in watched_ that matters
    bool telling_ = false;
    // Completions that come after destruction find it gone.
    std::shared_ptr<const int> alive_ = std::make_shared<const int>(0);
};

} // namespace halyard::linux_
