#include "output/Sanitise.h"

#include <array>
#include <cwchar>
#include <fmt/format.h>

#include "common/Utf8.h"

namespace halyard::ctl {
namespace {

// Marks that combine with what is before them; more than these make a tower.
constexpr int kMostMarks = 4;

struct Range {
    char32_t first;
    char32_t last;
};
// Format characters that change what is shown around them, or show nothing: bidi marks,
// embeddings and isolates, separators of lines, blanks without width, tags.
constexpr std::array<Range, 12> kFormats = {{{0x061C, 0x061C},
                                             {0x180E, 0x180E},
                                             {0x200B, 0x200B},
                                             {0x200E, 0x200F},
                                             {0x2028, 0x202E},
                                             {0x2060, 0x206F},
                                             {0xFEFF, 0xFEFF},
                                             {0xFFF9, 0xFFFB},
                                             {0xD800, 0xDFFF},
                                             {0xFFFE, 0xFFFF},
                                             {0xE0000, 0xE0FFF},
                                             {0xF0000, 0x10FFFF}}};

int cellsOf(char32_t code) {
    return ::wcwidth(static_cast<wchar_t>(code));
}

void appendEscape(std::string& out, char32_t code) {
    if (code == '\n') {
        out += "\\n";
    } else if (code == '\t') {
        out += "\\t";
    } else if (code == '\\') {
        out += "\\\\";
    } else if (code < 0x80) {
        out += fmt::format("\\x{:02x}", static_cast<unsigned>(code));
    } else {
        out += fmt::format("\\u{{{:x}}}", static_cast<unsigned>(code));
    }
}

} // namespace

char32_t nextCodePoint(std::string_view text, std::size_t& at) {
    const auto byte = [&](std::size_t i) {
        return static_cast<char32_t>(static_cast<unsigned char>(text[i]));
    };
    const char32_t lead = byte(at);
    const std::size_t length = lead < 0x80 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
    char32_t code = length == 1 ? lead : lead & (0x7FU >> length);
    for (std::size_t i = 1; i < length; ++i) {
        code = code << 6 | (byte(at + i) & 0x3FU);
    }
    at += length;
    return code;
}

bool isUnsafe(char32_t code) {
    if (code < 0x20 || (code >= 0x7F && code < 0xA0)) {
        return true;
    }
    for (const Range& range : kFormats) {
        if (code >= range.first && code <= range.last) {
            return true;
        }
    }
    return false;
}

std::string sanitised(std::string_view text) {
    const std::string valid = replaceInvalidUtf8(text);
    std::string out;
    out.reserve(valid.size());
    int marks = 0;
    for (std::size_t at = 0; at < valid.size();) {
        const std::size_t from = at;
        const char32_t code = nextCodePoint(valid, at);
        const int cells = isUnsafe(code) || code == '\\' ? -1 : cellsOf(code);
        // At the very start a mark would combine with what is not ours.
        marks = cells == 0 ? marks + 1 : 0;
        if (cells < 0 || marks > kMostMarks || (cells == 0 && from == 0)) {
            appendEscape(out, code);
        } else {
            out.append(valid, from, at - from);
        }
    }
    return out;
}

std::size_t displayWidth(std::string_view text) {
    std::size_t width = 0;
    for (std::size_t at = 0; at < text.size();) {
        const int cells = cellsOf(nextCodePoint(text, at));
        width += cells > 0 ? static_cast<std::size_t>(cells) : 0;
    }
    return width;
}

std::string shortened(std::string_view text, std::size_t width) {
    if (displayWidth(text) <= width) {
        return std::string(text);
    }
    std::size_t used = 0;
    std::size_t end = 0;
    for (std::size_t at = 0; at < text.size();) {
        const int cells = cellsOf(nextCodePoint(text, at));
        used += cells > 0 ? static_cast<std::size_t>(cells) : 0;
        if (used + 1 > width) {
            break;
        }
        end = at;
    }
    return width == 0 ? std::string() : std::string(text.substr(0, end)) + "…";
}

} // namespace halyard::ctl
