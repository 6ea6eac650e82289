#include "sinks/WireReader.h"

#include <array>
#include <protozero/exception.hpp>
#include <protozero/varint.hpp>

namespace tmxmetrics {

void WireReader::fail() {
    failed_ = true;
    rest_ = {};
}

std::uint64_t WireReader::readVarint() {
    const char* at = rest_.data();
    const char* const end = at + rest_.size();
    try {
        const std::uint64_t value = protozero::decode_varint(&at, end);
        rest_.remove_prefix(static_cast<std::size_t>(at - rest_.data()));
        return value;
    } catch (const protozero::exception&) {
        fail();
        return 0;
    }
}

WireReader::Key WireReader::readKey() {
    const std::uint64_t key = readVarint();
    if (key > 0xFFFFFFFF) {
        fail();
        return {};
    }
    return {static_cast<std::uint32_t>(key >> 3), static_cast<std::uint8_t>(key & 7)};
}

std::string_view WireReader::take(std::uint64_t length) {
    if (length > rest_.size()) {
        fail();
        return {};
    }
    const std::string_view taken = rest_.substr(0, static_cast<std::size_t>(length));
    rest_.remove_prefix(taken.size());
    return taken;
}

std::string_view WireReader::readBytes() {
    return take(readVarint());
}

void WireReader::skip(Key key) {
    if (key.wireType == kBeginGroup) {
        skipGroup(key.field);
    } else {
        skipScalar(key.wireType);
    }
}

void WireReader::skipScalar(std::uint8_t wireType) {
    switch (wireType) {
    case kVarint:
        readVarint();
        break;
    case kFixed64:
        take(8);
        break;
    case kBytes:
        readBytes();
        break;
    case kFixed32:
        take(4);
        break;
    default:
        fail();
    }
}

void WireReader::skipGroup(std::uint32_t field) {
    std::array<std::uint32_t, kMaxGroupDepth> open{field};
    std::size_t depth = 1;
    while (depth > 0 && !failed_) {
        const Key key = readKey();
        if (key.wireType == kEndGroup) {
            if (key.field != open[--depth]) {
                fail();
            }
        } else if (key.wireType != kBeginGroup) {
            skipScalar(key.wireType);
        } else if (depth < open.size()) {
            open[depth++] = key.field;
        } else {
            fail();
        }
    }
}

} // namespace tmxmetrics
