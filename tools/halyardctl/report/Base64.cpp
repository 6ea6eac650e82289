#include "report/Base64.h"

#include <cstdint>

namespace halyard::ctl {
namespace {

constexpr std::string_view kLetters =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

} // namespace

std::string base64(std::string_view bytes) {
    std::string text;
    text.reserve((bytes.size() + 2) / 3 * 4);
    for (std::size_t at = 0; at < bytes.size(); at += 3) {
        const auto byte = [&](std::size_t index) {
            return at + index < bytes.size()
                       ? std::uint32_t{static_cast<unsigned char>(bytes[at + index])}
                       : 0U;
        };
        const std::uint32_t bits = byte(0) << 16 | byte(1) << 8 | byte(2);
        for (std::size_t letter = 0; letter < 4; ++letter) {
            text += at + letter > bytes.size() ? '=' : kLetters[bits >> (18 - 6 * letter) & 0x3F];
        }
    }
    return text;
}

} // namespace halyard::ctl
