// The heads of MessagePack objects: what the first bytes say about the rest.
// Private to protocol/; FrameScanner and the decoders read through it.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace halyard::protocol {

enum class Family : std::uint8_t {
    Invalid, // 0xC1, or the end of the bytes.
    Nil,
    False,
    True,
    Signed,
    Unsigned,
    Float32,
    Float64,
    Text, // str and bin alike
    Array,
    Map,
    Extension, // The payload begins with the type.
};

constexpr bool isContainer(Family family) noexcept {
    return family == Family::Array || family == Family::Map;
}

// What the first byte of an object says.
struct Format {
    Family family = Family::Invalid;
    std::uint8_t lengthBytes = 0; // Bytes of a length that follows.
    std::uint8_t size = 0;        // To be added to that length.
};

constexpr Format formatOf(unsigned byte) noexcept {
    const auto low = [byte](unsigned mask) { return static_cast<std::uint8_t>(byte & mask); };
    // 1, 2, 4 or 8 by the last bits, as the groups of the format count.
    const auto power = [low](unsigned mask) { return static_cast<std::uint8_t>(1U << low(mask)); };
    if (byte <= 0x7F || byte >= 0xE0) {
        return {Family::Signed, 0, 0}; // The byte itself is the number.
    }
    if (byte <= 0x8F) {
        return {Family::Map, 0, low(0x0F)};
    }
    if (byte <= 0x9F) {
        return {Family::Array, 0, low(0x0F)};
    }
    if (byte <= 0xBF) {
        return {Family::Text, 0, low(0x1F)};
    }
    switch (byte) {
    case 0xC0:
        return {Family::Nil, 0, 0};
    case 0xC2:
        return {Family::False, 0, 0};
    case 0xC3:
        return {Family::True, 0, 0};
    case 0xC4:
    case 0xC5:
    case 0xC6:
        return {Family::Text, power(0x03), 0};
    case 0xC7:
        return {Family::Extension, 1, 1};
    case 0xC8:
        return {Family::Extension, 2, 1};
    case 0xC9:
        return {Family::Extension, 4, 1};
    case 0xCA:
        return {Family::Float32, 0, 4};
    case 0xCB:
        return {Family::Float64, 0, 8};
    case 0xCC:
    case 0xCD:
    case 0xCE:
    case 0xCF:
        return {Family::Unsigned, 0, power(0x03)};
    case 0xD0:
    case 0xD1:
    case 0xD2:
    case 0xD3:
        return {Family::Signed, 0, power(0x03)};
    case 0xD4:
    case 0xD5:
    case 0xD6:
    case 0xD7:
        return {Family::Extension, 0, static_cast<std::uint8_t>(1 + (1U << (byte - 0xD4)))};
    case 0xD8:
        return {Family::Extension, 0, 17};
    case 0xD9:
        return {Family::Text, 1, 0};
    case 0xDA:
        return {Family::Text, 2, 0};
    case 0xDB:
        return {Family::Text, 4, 0};
    case 0xDC:
        return {Family::Array, 2, 0};
    case 0xDD:
        return {Family::Array, 4, 0};
    case 0xDE:
        return {Family::Map, 2, 0};
    case 0xDF:
        return {Family::Map, 4, 0};
    default:
        return {};
    }
}

inline constexpr auto kFormats = [] {
    std::array<Format, 256> formats{};
    for (unsigned byte = 0; byte < formats.size(); ++byte) {
        formats[byte] = formatOf(byte);
    }
    return formats;
}();

// The bytes an object takes when its first byte alone tells (most do: small
// integers, short text, reals), and 0 for containers and all others.
inline constexpr auto kPlainLengths = [] {
    std::array<std::uint8_t, 256> lengths{};
    for (unsigned byte = 0; byte < lengths.size(); ++byte) {
        const Format format = kFormats[byte];
        if (format.family != Family::Invalid && !isContainer(format.family) &&
            format.lengthBytes == 0) {
            lengths[byte] = static_cast<std::uint8_t>(1 + format.size);
        }
    }
    return lengths;
}();

template <class Unsigned> Unsigned loadBig(const char* from) noexcept {
    Unsigned value = 0;
    std::memcpy(&value, from, sizeof(value));
    if constexpr (std::endian::native == std::endian::big || sizeof(value) == 1) {
        return value;
    } else if constexpr (sizeof(value) == 2) {
        return __builtin_bswap16(value);
    } else if constexpr (sizeof(value) == 4) {
        return __builtin_bswap32(value);
    } else {
        return __builtin_bswap64(value);
    }
}

// Requires that `bytes` is 0, 1, 2, 4 or 8.
inline std::uint64_t loadBig(const char* from, std::size_t bytes) noexcept {
    switch (bytes) {
    case 0:
        return 0;
    case 1:
        return loadBig<std::uint8_t>(from);
    case 2:
        return loadBig<std::uint16_t>(from);
    case 4:
        return loadBig<std::uint32_t>(from);
    default:
        return loadBig<std::uint64_t>(from);
    }
}

// One object; of a container only its head.
struct Token {
    Family family = Family::Invalid;
    // Payload bytes, or the elements of an array, or the pairs of a map.
    std::size_t size = 0;
    const char* payload = nullptr;

    std::string_view bytes() const noexcept { return {payload, size}; }
    // The objects that follow as this one's content.
    std::size_t children() const noexcept {
        return family == Family::Array ? size : family == Family::Map ? 2 * size : 0;
    }
};

// Walks over the objects of a buffer, which it borrows. Memory-safe on any
// bytes: what does not fit into the buffer is Invalid, and so is all that comes
// after it. A container is never larger than the bytes that are left, so its
// size may be trusted to reserve memory.
class Reader {
public:
    explicit Reader(std::string_view bytes) noexcept
        : at_(bytes.data()), end_(bytes.data() + bytes.size()) {}

    bool atEnd() const noexcept { return at_ == end_; }

    Token next() noexcept {
        const std::size_t left = static_cast<std::size_t>(end_ - at_);
        if (left == 0) {
            return {};
        }
        const Format format = kFormats[static_cast<unsigned char>(*at_)];
        const std::size_t head = 1U + format.lengthBytes;
        if (format.family == Family::Invalid || left < head) {
            return invalid();
        }
        Token token{format.family, format.size, at_ + head};
        if (format.lengthBytes != 0) {
            token.size += loadBig(at_ + 1, format.lengthBytes);
        }
        const std::size_t needed = isContainer(token.family) ? token.children() : token.size;
        if (left - head < needed) {
            return invalid();
        }
        at_ += isContainer(token.family) ? head : head + token.size;
        return token;
    }

private:
    Token invalid() noexcept {
        at_ = end_;
        return {};
    }

    const char* at_;
    const char* end_;
};

} // namespace halyard::protocol
