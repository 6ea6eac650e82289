// Where the tracker's sessions and messages go.
#pragma once

#include <cstdint>

#include "Contents.h"

namespace halyard::pipewire {

struct Message {
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    Contents contents;
};

// Implementers must neither block nor call back into the tracker.
class SessionSink {
public:
    virtual ~SessionSink() = default;

    // Makes, configures and starts a session.
    virtual void open(std::int64_t reporterID, std::uint16_t serviceType,
                      const Contents& configuration) = 0;
    // Requires an open session of this ID, as does close().
    virtual void send(std::int64_t reporterID, const Message& message) = 0;
    // Stops and destroys it.
    virtual void close(std::int64_t reporterID) = 0;
};

} // namespace halyard::pipewire
