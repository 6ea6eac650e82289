#include "PlainText.h"

#include <algorithm>
#include <cstdint>
#include <fmt/core.h>

namespace halyard::pipewire {

namespace {

struct Character {
    std::size_t bytes = 1;
    std::uint32_t code = 0;
    bool valid = false;
};

bool continues(char byte) {
    return (static_cast<unsigned char>(byte) & 0xC0) == 0x80;
}

// The first character of `text`; its first byte alone when that begins none.
Character first(std::string_view text) {
    const auto lead = static_cast<unsigned char>(text.front());
    if (lead < 0x80) {
        return {1, lead, true};
    }
    const std::size_t bytes = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
    if (lead < 0xC2 || lead > 0xF4 || text.size() < bytes) {
        return {1, lead, false};
    }
    std::uint32_t code = lead & (0x7FU >> bytes);
    for (std::size_t i = 1; i < bytes; ++i) {
        if (!continues(text[i])) {
            return {1, lead, false};
        }
        code = code << 6 | (static_cast<unsigned char>(text[i]) & 0x3FU);
    }
    const bool shortest = code >= (bytes == 2 ? 0x80U : bytes == 3 ? 0x800U : 0x10000U);
    const bool surrogate = code >= 0xD800 && code <= 0xDFFF;
    return shortest && !surrogate && code <= 0x10FFFF ? Character{bytes, code, true}
                                                      : Character{1, lead, false};
}

// Controls, and marks that turn the direction of what follows or break the line.
bool isHarmless(std::uint32_t code) {
    const bool control = code < 0x20 || (code >= 0x7F && code < 0xA0);
    const bool mark = (code >= 0x200B && code <= 0x200F) || (code >= 0x2028 && code <= 0x202E) ||
                      (code >= 0x2060 && code <= 0x206F) || code == 0x061C || code == 0xFEFF;
    return !control && !mark;
}

std::string shown(const Character& character, std::string_view bytes) {
    if (character.valid && isHarmless(character.code)) {
        return std::string(bytes);
    }
    return character.code < 0x100 ? fmt::format("\\x{:02x}", character.code)
                                  : fmt::format("\\u{{{:x}}}", character.code);
}

} // namespace

std::string plainText(std::string_view text, std::size_t longest) {
    std::string result;
    std::string cut; // as far as there is room for an ellipsis behind
    std::size_t width = 0;
    while (!text.empty()) {
        const Character character = first(text);
        const std::string piece = shown(character, text.substr(0, character.bytes));
        if (width + 1 <= longest) {
            cut = result;
        }
        width += widthOf(piece);
        if (width > longest) {
            return cut + "…";
        }
        result += piece;
        text.remove_prefix(character.bytes);
    }
    return result;
}

std::size_t widthOf(std::string_view text) {
    return static_cast<std::size_t>(
        std::count_if(text.begin(), text.end(), [](char byte) { return !continues(byte); }));
}

} // namespace halyard::pipewire
