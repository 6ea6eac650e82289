// Rules that read a stream's properties: what it is, whose it is, and which
// service it counts for. Pure functions, from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "GraphEvents.h"

namespace halyard::pipewire {

enum class Direction : std::uint8_t { Playback, Capture };

// Which streams report: playback and capture streams of applications. Not level
// meters, nor the ends of loopbacks and filters, whose sound comes from streams
// that report already. Nullopt for those and for everything that is no stream.
[[nodiscard]] std::optional<Direction> reportedDirection(const Properties& node);

// A node that takes and gives sound as one, as those of JACK programs do: what it
// is linked to tells whether it plays or captures, and sound goes through it.
[[nodiscard]] bool passesSound(const Properties& node);

// What sessions need to know of, by the few properties that are told before a node
// is listened to.
[[nodiscard]] bool isWatched(const Properties& node);

// A device, or what stands for one: something that streams are linked to.
[[nodiscard]] bool isDevice(const Properties& node);

// Whether what a stream takes from this device is what others play there, as from
// the monitor of a sink, and not what the device itself hears.
[[nodiscard]] bool givesMonitor(const Properties& device, const Properties& listener);

// The service type (as the daemon numbers them) of a stream by its media role.
[[nodiscard]] std::uint16_t serviceTypeOf(const Properties& node, Direction direction);

// What to call the application. `client` is the stream's client, empty if
// unknown. "Unknown" when nobody gives a name.
[[nodiscard]] std::string applicationName(const Properties& node, const Properties& client);

// The program's file name; empty when unknown.
[[nodiscard]] std::string processName(const Properties& node, const Properties& client);

// Whether another process speaks for the program: a sound server of another kind
// has the node, and the thread that serves it is that server's.
[[nodiscard]] bool viaServer(const Properties& node, const Properties& client);

// The application's process, not that of a server that speaks for it. What the
// kernel says of the other end of the socket comes first, where that is the
// program; what a program says of itself counts only where its numbers are ours.
[[nodiscard]] std::optional<std::int64_t> processId(const Properties& node,
                                                    const Properties& client);

// How much sound a server that speaks for the program holds ready for this stream,
// of this format ("S16LE 2ch 48000Hz"). Nullopt when there is none, or nothing tells.
[[nodiscard]] std::optional<double> bufferSeconds(const Properties& node,
                                                  const std::string& format);

// The volume as sliders show it, 0 to 1, of what multiplies samples.
[[nodiscard]] double perceivedVolume(float linearVolume);

// Empty when absent.
[[nodiscard]] std::string property(const Properties& properties, std::string_view key);

} // namespace halyard::pipewire
