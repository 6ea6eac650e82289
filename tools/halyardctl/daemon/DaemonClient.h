// One connection to the daemon, for a question at a time.
//
// libhalyard is made for programs that go on whether or not the daemon is there: it
// waits for it, in silence. Here somebody wants to know at once why there is no answer.
//
// Blocking; not thread-safe.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>

#include "common/Value.h"
#include "protocol/Wire.h"
#include "reading/Trouble.h"

namespace halyard::ctl {

class DaemonClient {
public:
    // An answer may take `patience`, if that is not 0.
    static reading::Outcome<DaemonClient> connect(const std::filesystem::path& socket,
                                                  std::chrono::seconds patience = {});
    ~DaemonClient();
    DaemonClient(DaemonClient&& other) noexcept;
    DaemonClient(const DaemonClient&) = delete;
    DaemonClient& operator=(const DaemonClient&) = delete;

    // Waits for the answer.
    reading::Outcome<Value> call(protocol::Method method,
                                 const protocol::Arguments& arguments = {});
    // Sends a request whose answer nobody waits for; it is passed over when it comes.
    reading::Outcome<void> start(protocol::Method method, const protocol::Arguments& arguments);

    // The connection is gone: nothing more will come of it.
    bool isLost() const { return lost_; }

private:
    DaemonClient(int descriptor, std::filesystem::path socket);
    reading::Outcome<void> send(std::string_view frame);
    // The next answer, whatever it answers.
    reading::Outcome<protocol::Answer> receive();
    reading::Trouble lost();

    int descriptor_;
    std::filesystem::path socket_;
    std::uint32_t lastID_ = 0;
    bool answered_ = false;
    bool lost_ = false;
    std::string received_;
    protocol::FrameScanner scanner_;
};

} // namespace halyard::ctl
