// Any bytes may come as a portion of the profiler's records: they are read as far as
// they make sense, within their size, and what they tell of streams stays in bounds.

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "GlitchFinder.h"
#include "PipeWireHeaders.h"
#include "ProfileReader.h"

using namespace halyard::pipewire;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    // libpipewire hands out aligned portions; exactly this long, for the sanitizer.
    std::vector<std::uint64_t> portion(size / 8);
    if (portion.empty()) {
        return 0;
    }
    std::memcpy(portion.data(), data, portion.size() * 8);
    GlitchFinder finder;
    finder.tell = [](const Episode& episode, bool) {
        if (episode.cycleLength <= 0 || episode.end < episode.start) {
            std::abort();
        }
    };
    for (ObjectId node = 1; node < 64; ++node) {
        finder.begin(node, node, 1);
    }
    readProfile(reinterpret_cast<const spa_pod*>(portion.data()), portion.size() * 8,
                [&](const Cycle& cycle) {
                    if (cycle.followers.size() > Cycle::kMaxFollowers || cycle.length() <= 0) {
                        std::abort();
                    }
                    finder.take(cycle);
                    finder.due(cycle.clock);
                });
    finder.flush();
    return 0;
}
