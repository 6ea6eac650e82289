// Reports the tracker's sessions to the halyard daemon through libhalyard.
//
// Single-threaded like the tracker that calls it; libhalyard's own thread
// reconnects and makes the sessions again.
#pragma once

#include <cstdint>
#include <map>

#include "SessionSink.h"
#include "halyard/halyard.hpp"

namespace halyard::pipewire {

class ClientSessions final : public SessionSink {
public:
    // Borrows `client`.
    explicit ClientSessions(reporting::Client& client) : client_(client) {}

    void open(std::int64_t reporterID, std::uint16_t serviceType,
              const Contents& configuration) override;
    void send(std::int64_t reporterID, const Message& message) override;
    void close(std::int64_t reporterID) override;

    // Sessions and messages that libhalyard did not take.
    std::uint64_t refused() const { return refused_; }

private:
    void count(reporting::Result result);

    reporting::Client& client_;
    std::map<std::int64_t, reporting::Session> sessions_;
    std::uint64_t refused_ = 0;
};

} // namespace halyard::pipewire
