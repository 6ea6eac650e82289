// A look at a PipeWire daemon that lasts so long, or half a second longer while the
// cycle of a device that runs is not known yet, for people who ask what is there.
// Has a loop of its own and is done when it returns.
#pragma once

#include <chrono>
#include <string>

namespace halyard::pipewire {

struct Look {
    bool answered = false; // by a daemon
    std::string text;      // what is there, or why nothing is known
};

// Throws std::runtime_error when libpipewire cannot be set up at all. `remote` is
// the daemon's name, empty for the usual one.
[[nodiscard]] Look lookOnce(const std::string& remote, std::chrono::milliseconds duration);

} // namespace halyard::pipewire
