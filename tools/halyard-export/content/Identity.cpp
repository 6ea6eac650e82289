#include "content/Identity.h"

#include <algorithm>
#include <bit>
#include <fmt/compile.h>
#include <iterator>
#include <uuid/uuid.h>

namespace halyard::exporting {
namespace {

using Uuid = std::array<unsigned char, sizeof(uuid_t)>;

// The namespace of all names of ours, drawn once.
constexpr Uuid kNamespace = {0x6b, 0x1e, 0x0f, 0x52, 0x3c, 0x0a, 0x4d, 0x8e,
                             0x9a, 0x77, 0x21, 0xc4, 0xd5, 0x5e, 0xb0, 0x93};

Uuid named(const std::string& name) {
    Uuid id{};
    uuid_generate_sha1(id.data(), kNamespace.data(), name.data(), name.size());
    return id;
}

// Exact, whatever the digits.
std::uint64_t bits(double time) {
    return std::bit_cast<std::uint64_t>(time);
}

// The upper bits of the product depend on all of the time's.
std::uint16_t mixed(double time) {
    return static_cast<std::uint16_t>((bits(time) * 0x9E3779B97F4A7C15U) >> 48U);
}

template <class ID> ID firstOf(const Uuid& from) {
    ID id;
    std::copy_n(from.begin(), id.size(), id.begin());
    return id;
}

std::string sessionName(const std::string& device, std::int64_t row, double opened) {
    return fmt::format("{}/session/{}/{:x}", device, row, bits(opened));
}

} // namespace

TraceID Identity::traceOf(std::int64_t row, double opened) const {
    return firstOf<TraceID>(named(sessionName(device_, row, opened)));
}

SpanID Identity::spanOf(std::int64_t row, double opened) const {
    return firstOf<SpanID>(named(sessionName(device_, row, opened) + "/span"));
}

SpanID Identity::spanOfGlitch(std::int64_t row, double opened, double start,
                              std::string_view node) const {
    return firstOf<SpanID>(named(
        fmt::format("{}/glitch/{:x}/{}", sessionName(device_, row, opened), bits(start), node)));
}

void Identity::appendRecord(std::string& text, std::string_view table, std::int64_t row,
                            double time) const {
    fmt::format_to(std::back_inserter(text), FMT_COMPILE("{}/{}/{:04x}/{}"), device_, table,
                   mixed(time), row);
}

} // namespace halyard::exporting
