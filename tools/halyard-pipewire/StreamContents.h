// What a session's configuration and messages say of its stream. Pure functions,
// from any thread.
#pragma once

#include <cstdint>
#include <set>
#include <string>

#include "Contents.h"
#include "StreamFacts.h"
#include "StreamObserver.h"

namespace halyard::pipewire {

// Where a stream plays or captures, as it was told last or is to be told next.
struct Surroundings {
    std::string format;
    std::set<std::string> devices;
    bool hears = false;    // what a device hears: it holds a microphone
    bool monitors = false; // what others play on a device
    bool streamMuted = false;
    bool devicesMuted = false; // each of them
};

// Facts that help to tell streams apart, and none that tell what is listened to:
// titles and file names stay here. `client` is the stream's, empty if unknown.
[[nodiscard]] Contents configurationOf(const Properties& node, const Properties& client,
                                       Direction direction);

[[nodiscard]] std::uint32_t categoryOf(Direction direction);
[[nodiscard]] Contents startContents(std::int64_t run, const Surroundings& surroundings);
[[nodiscard]] Contents stopContents(std::int64_t run, const StreamEnd& end);
[[nodiscard]] Contents routeContents(const std::set<std::string>& previous,
                                     const Surroundings& surroundings);
[[nodiscard]] Contents volumeContents(double volume, bool playing, const std::string& process,
                                      const Surroundings& surroundings);

} // namespace halyard::pipewire
