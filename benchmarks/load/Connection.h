// A blocking client connection, for one thread. Everything throws
// std::runtime_error when the peer fails, refuses or is silent too long.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

#include "load/Messages.h"
#include "protocol/Wire.h"

namespace halyard::load {

class Connection {
public:
    Connection(const std::string& socketPath, std::chrono::seconds timeout);
    ~Connection();
    Connection(Connection&& other) noexcept;
    Connection& operator=(Connection&&) = delete;

    // Sends one request and waits for its answer. Requires that no other
    // request is unanswered.
    Value call(protocol::Method method, const protocol::Arguments& arguments = {});
    void notify(protocol::Method method, const protocol::Arguments& arguments = {});
    // Returns when the daemon has taken everything sent before.
    void barrier() { call(protocol::Method::ReporterIDValid); }

    // Of what was sent by send(). Requires that one request is unanswered.
    void awaitAnswer();

    // In blocks of kBlockBytes, as a client library that coalesces would.
    void send(std::string_view bytes);
    // Keeps `inFlight` requests of the stream unanswered; all are answered when
    // it returns. Requires that the stream's messages are requests.
    void sendRequests(const Stream& stream, std::uint32_t inFlight);

    static constexpr std::size_t kBlockBytes = 60 * 1024;

private:
    protocol::Answer readAnswer();
    bool takeAnswer(protocol::Answer& answer);
    void awaitReadable() const;
    void receive();

    int socket_ = -1;
    std::string received_;
    std::size_t consumed_ = 0;
    protocol::FrameScanner scanner_;
    std::uint32_t nextID_ = 0x40000000;
};

} // namespace halyard::load
