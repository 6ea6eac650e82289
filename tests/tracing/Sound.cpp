#include "Sound.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <numbers>

namespace halyard::tracing_test {
namespace {

constexpr int kRate = 48000;

MemoryFile& fileOf(void* user) {
    return *static_cast<MemoryFile*>(user);
}

sf_count_t sizeOf(void* user) {
    return static_cast<sf_count_t>(fileOf(user).bytes.size());
}

sf_count_t tell(void* user) {
    return static_cast<sf_count_t>(fileOf(user).at);
}

sf_count_t seek(sf_count_t offset, int whence, void* user) {
    const sf_count_t from = whence == SEEK_SET ? 0 : whence == SEEK_CUR ? tell(user) : sizeOf(user);
    fileOf(user).at = static_cast<std::size_t>(std::max<sf_count_t>(from + offset, 0));
    return tell(user);
}

sf_count_t read(void* to, sf_count_t count, void* user) {
    MemoryFile& file = fileOf(user);
    const std::size_t left = file.bytes.size() - std::min(file.at, file.bytes.size());
    const std::size_t size = std::min(static_cast<std::size_t>(count), left);
    std::copy_n(file.bytes.data() + file.at, size, static_cast<unsigned char*>(to));
    file.at += size;
    return static_cast<sf_count_t>(size);
}

sf_count_t write(const void* from, sf_count_t count, void* user) {
    MemoryFile& file = fileOf(user);
    const auto size = static_cast<std::size_t>(count);
    file.bytes.resize(std::max(file.bytes.size(), file.at + size));
    std::memcpy(file.bytes.data() + file.at, from, size);
    file.at += size;
    return count;
}

SNDFILE* open(MemoryFile& file, int mode, SF_INFO& format) {
    SF_VIRTUAL_IO operations = MemoryFile::operations();
    file.at = 0;
    SNDFILE* const opened = ::sf_open_virtual(&operations, mode, &format, &file);
    if (opened == nullptr) {
        std::fprintf(stderr, "traced_work: %s\n", ::sf_strerror(nullptr));
        std::exit(1);
    }
    return opened;
}

} // namespace

SF_VIRTUAL_IO MemoryFile::operations() {
    return {sizeOf, seek, read, write, tell};
}

MemoryFile compressedTone(double hertz) {
    MemoryFile sound;
    SF_INFO format{0, kRate, kChannels, SF_FORMAT_FLAC | SF_FORMAT_PCM_16, 0, 0};
    SNDFILE* const file = open(sound, SFM_WRITE, format);
    std::vector<float> samples;
    for (int frame = 0; frame < kRate; ++frame) {
        const double phase = 2 * std::numbers::pi * hertz * frame / kRate;
        samples.insert(samples.end(), kChannels, static_cast<float>(0.4 * std::sin(phase)));
    }
    ::sf_writef_float(file, samples.data(), kRate);
    ::sf_close(file);
    return sound;
}

Voice::Voice(MemoryFile sound) : sound_(std::move(sound)) {
    SF_INFO format{};
    file_ = open(sound_, SFM_READ, format);
}

Voice::~Voice() {
    ::sf_close(file_);
}

void Voice::decode(Block& block) {
    constexpr auto kFrames = static_cast<sf_count_t>(kBlockFrames);
    if (::sf_readf_float(file_, block.data(), kFrames) < kFrames) {
        ::sf_seek(file_, 0, SEEK_SET);
    }
}

void mix(const Block& from, float volume, Block& to) {
    for (std::size_t i = 0; i < to.size(); ++i) {
        to[i] += volume * from[i];
    }
}

} // namespace halyard::tracing_test
