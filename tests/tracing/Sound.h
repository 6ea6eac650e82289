// A compressed sound in memory, and its decoding block by block.
#pragma once

#include <array>
#include <cstddef>
#include <sndfile.h>
#include <vector>

namespace halyard::tracing_test {

inline constexpr int kChannels = 2;
inline constexpr std::size_t kBlockFrames = 1024;
using Block = std::array<float, kBlockFrames * kChannels>;

// A file in memory, as libsndfile reads and writes it. Stays where it is while
// the library has it open.
struct MemoryFile {
    std::vector<unsigned char> bytes;
    std::size_t at = 0;

    static SF_VIRTUAL_IO operations();
};

// A tone of `hertz` as FLAC.
MemoryFile compressedTone(double hertz);

// Decodes a sound over and over. One thread.
class Voice {
public:
    explicit Voice(MemoryFile sound);
    ~Voice();
    Voice(const Voice&) = delete;
    Voice& operator=(const Voice&) = delete;

    void decode(Block& block);

private:
    MemoryFile sound_;
    SNDFILE* file_;
};

// Adds `from`, at this volume, to `to`.
void mix(const Block& from, float volume, Block& to);

} // namespace halyard::tracing_test
