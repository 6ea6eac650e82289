#include "common/Utf8.h"

#include <cstdint>
#include <cstring>

namespace halyard {
namespace {

struct Step {
    std::size_t length; // Bytes taken, at least 1.
    bool valid;
};

bool inRange(std::string_view text, std::size_t index, unsigned low, unsigned high) noexcept {
    if (index >= text.size()) {
        return false;
    }
    const auto byte = static_cast<unsigned char>(text[index]);
    return byte >= low && byte <= high;
}

// Table 3-7 of the Unicode standard: the second byte's range depends on the
// first, the others are 80..BF. Requires a non-empty `text`.
Step step(std::string_view text) noexcept {
    const auto lead = static_cast<unsigned char>(text[0]);
    if (lead < 0x80) {
        return {1, true};
    }
    std::size_t length = 0;
    unsigned low = 0x80;
    unsigned high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
        length = 2;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
        length = 3;
        low = lead == 0xE0 ? 0xA0 : low;
        high = lead == 0xED ? 0x9F : high;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
        length = 4;
        low = lead == 0xF0 ? 0x90 : low;
        high = lead == 0xF4 ? 0x8F : high;
    } else {
        return {1, false};
    }
    if (!inRange(text, 1, low, high)) {
        return {1, false};
    }
    for (std::size_t i = 2; i < length; ++i) {
        if (!inRange(text, i, 0x80, 0xBF)) {
            return {i, false};
        }
    }
    return {length, true};
}

std::size_t asciiPrefix(std::string_view text) noexcept {
    std::size_t at = 0;
    for (; at + 8 <= text.size(); at += 8) {
        std::uint64_t word = 0;
        std::memcpy(&word, text.data() + at, 8);
        if ((word & 0x8080808080808080U) != 0) {
            break;
        }
    }
    while (at < text.size() && static_cast<unsigned char>(text[at]) < 0x80) {
        ++at;
    }
    return at;
}

} // namespace

bool isValidUtf8(std::string_view text) noexcept {
    for (text.remove_prefix(asciiPrefix(text)); !text.empty();) {
        const Step next = step(text);
        if (!next.valid) {
            return false;
        }
        text.remove_prefix(next.length);
    }
    return true;
}

std::string replaceInvalidUtf8(std::string_view text) {
    std::string result;
    result.reserve(text.size());
    while (!text.empty()) {
        const Step next = step(text);
        result.append(next.valid ? text.substr(0, next.length) : "\xEF\xBF\xBD");
        text.remove_prefix(next.length);
    }
    return result;
}

} // namespace halyard
