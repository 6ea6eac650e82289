#include "tracing/BinaryPropertyListExtent.h"

#include <algorithm>

namespace halyard {
namespace {

constexpr std::size_t kHeaderBytes = 8;
constexpr std::size_t kTrailerBytes = 32;
// From the trailer's begin.
constexpr std::size_t kOffsetWidth = 6;
constexpr std::size_t kReferenceWidth = 7;
constexpr std::size_t kObjects = 8;
constexpr std::size_t kRoot = 16;
constexpr std::size_t kTable = 24;

// What a value takes at least, once it is read.
constexpr std::uint64_t kValueBytes = 16;

constexpr unsigned kLongLength = 15; // the length follows as a number

} // namespace

std::optional<std::uint64_t> BinaryPropertyListExtent::number(std::uint64_t offset,
                                                              std::size_t width) const {
    if (width == 0 || width > sizeof(std::uint64_t) || offset > bytes_.size() ||
        bytes_.size() - offset < width) {
        return std::nullopt;
    }
    std::uint64_t value = 0;
    for (const char byte : bytes_.substr(offset, width)) {
        value = value << 8 | static_cast<unsigned char>(byte);
    }
    return value;
}

bool BinaryPropertyListExtent::readTrailer() {
    if (bytes_.size() < kHeaderBytes + kTrailerBytes) {
        return false;
    }
    const std::size_t trailer = bytes_.size() - kTrailerBytes;
    offsetWidth_ = *number(trailer + kOffsetWidth, 1);
    referenceWidth_ = *number(trailer + kReferenceWidth, 1);
    root_ = *number(trailer + kRoot, 8);
    table_ = *number(trailer + kTable, 8);
    const std::uint64_t objects = *number(trailer + kObjects, 8);
    if (table_ > trailer || offsetWidth_ == 0 || objects > (trailer - table_) / offsetWidth_) {
        return false;
    }
    known_.resize(objects);
    return true;
}

std::optional<std::uint64_t> BinaryPropertyListExtent::measure() {
    if (!readTrailer()) {
        return std::nullopt;
    }
    const auto whole = extentOf(root_, 1);
    return whole ? std::optional(whole->bytes) : std::nullopt;
}

std::optional<BinaryPropertyListExtent::Object>
BinaryPropertyListExtent::objectAt(std::uint64_t index) const {
    const auto offset = number(table_ + index * offsetWidth_, offsetWidth_);
    const auto marker = offset ? number(*offset, 1) : std::nullopt;
    if (!marker || *offset >= table_) {
        return std::nullopt;
    }
    const unsigned low = *marker & 0xF;
    switch (*marker >> 4) {
    case 0x0: // null, booleans
        return Object{kValueBytes};
    case 0x1: // integers, reals and dates of 2^low bytes
    case 0x2:
    case 0x3:
        return low <= 4 ? std::optional(Object{kValueBytes + (1ULL << low)}) : std::nullopt;
    case 0x8: // identifiers
        return Object{kValueBytes + 1 + low};
    default:
        return objectOfLength(*offset, static_cast<unsigned>(*marker));
    }
}

std::optional<BinaryPropertyListExtent::Object>
BinaryPropertyListExtent::objectOfLength(std::uint64_t offset, unsigned marker) const {
    std::uint64_t length = marker & 0xF;
    std::uint64_t content = offset + 1;
    if (length == kLongLength) {
        const auto width = number(content, 1);
        const auto longLength = width && (*width >> 4) == 1
                                    ? number(content + 1, std::size_t{1} << (*width & 0xF))
                                    : std::nullopt;
        if (!longLength) {
            return std::nullopt;
        }
        content += 1 + (1ULL << (*width & 0xF));
        length = *longLength;
    }
    if (length > bytes_.size()) {
        return std::nullopt; // Nothing below overflows.
    }
    switch (marker >> 4) {
    case 0x4: // data
        return Object{kValueBytes + length};
    case 0x5: // ASCII
        return Object{kValueBytes + length, content, 0, 0, 1};
    case 0x6: // UTF-16
        return Object{kValueBytes + 2 * length, content, 0, 0, 2};
    case 0xA: // array
        return Object{kValueBytes, content, length};
    case 0xD: // dictionary: keys, then values
        return Object{kValueBytes, content, 2 * length, length};
    default:
        return std::nullopt;
    }
}

// A zero would end the key for readers in C, some of which abort then.
bool BinaryPropertyListExtent::isKey(std::uint64_t index) const {
    const auto object = objectAt(index);
    if (!object || object->unit == 0) {
        return false;
    }
    const std::uint64_t end = object->content + object->bytes - kValueBytes;
    for (std::uint64_t at = object->content; at < end; at += object->unit) {
        const auto character = number(at, object->unit);
        if (!character || *character == 0) {
            return false;
        }
    }
    return true;
}

std::optional<BinaryPropertyListExtent::Extent>
BinaryPropertyListExtent::extentOf(std::uint64_t index, int level) {
    if (index >= known_.size() || level > mostLevels_) {
        return std::nullopt; // One that holds itself has no last level.
    }
    if (known_[index].bytes == 0) {
        const auto object = objectAt(index);
        const auto sum = object ? sumOf(*object, level) : std::nullopt;
        if (!sum) {
            return std::nullopt;
        }
        known_[index] = *sum;
    }
    const Extent& known = known_[index];
    return level - 1 + known.levels <= mostLevels_ ? std::optional(known) : std::nullopt;
}

std::optional<BinaryPropertyListExtent::Extent>
BinaryPropertyListExtent::sumOf(const Object& object, int level) {
    Extent sum{object.bytes, 1};
    for (std::uint64_t i = 0; i < object.references && sum.bytes <= mostBytes_; ++i) {
        const auto index = number(object.content + i * referenceWidth_, referenceWidth_);
        const auto item = index ? extentOf(*index, level + 1) : std::nullopt;
        if (!item || (i < object.keys && !isKey(*index))) {
            return std::nullopt;
        }
        sum.bytes += item->bytes;
        sum.levels = std::max(sum.levels, 1 + item->levels);
    }
    return sum.bytes <= mostBytes_ ? std::optional(sum) : std::nullopt;
}

} // namespace halyard
