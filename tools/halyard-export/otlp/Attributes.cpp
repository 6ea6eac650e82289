#include "otlp/Attributes.h"

#include <bit>
#include <cmath>

#include "common/Utf8.h"
#include <protozero/varint.hpp>

namespace halyard::exporting::otlp {
namespace {

using protozero::length_of_varint;
using protozero::pbf_wire_type;

constexpr std::uint32_t headOf(Tag tag, pbf_wire_type type) {
    return (tag << 3U) | static_cast<std::uint32_t>(type);
}

void appendHead(std::string& bytes, Tag tag, std::size_t length) {
    protozero::add_varint_to_buffer(&bytes, headOf(tag, pbf_wire_type::length_delimited));
    protozero::add_varint_to_buffer(&bytes, length);
}

std::size_t sizeOfField(Tag tag, std::size_t length) {
    return static_cast<std::size_t>(length_of_varint(headOf(tag, pbf_wire_type::length_delimited)) +
                                    length_of_varint(length)) +
           length;
}

} // namespace

AnyValue::AnyValue(Tag tag, std::string_view tail) : tail_(tail) {
    putVarint(headOf(tag, pbf_wire_type::length_delimited));
    putVarint(tail.size());
}

AnyValue AnyValue::ofInteger(std::int64_t value) {
    AnyValue any;
    any.putVarint(headOf(any_value::kInt, pbf_wire_type::varint));
    any.putVarint(static_cast<std::uint64_t>(value));
    return any;
}

AnyValue AnyValue::ofReal(double value) {
    AnyValue any;
    any.putVarint(headOf(any_value::kDouble, pbf_wire_type::fixed64));
    auto bits = std::bit_cast<std::uint64_t>(value);
    for (std::size_t i = 0; i < sizeof(bits); ++i, bits >>= 8U) {
        any.put(static_cast<char>(bits & 0xFFU));
    }
    return any;
}

AnyValue AnyValue::ofBoolean(bool value) {
    AnyValue any;
    any.putVarint(headOf(any_value::kBool, pbf_wire_type::varint));
    any.put(value ? 1 : 0);
    return any;
}

void AnyValue::putVarint(std::uint64_t value) {
    for (; value >= 0x80U; value >>= 7U) {
        put(static_cast<char>((value & 0x7FU) | 0x80U));
    }
    put(static_cast<char>(value));
}

void appendAttribute(std::string& message, Tag tag, std::string_view prefix, std::string_view key,
                     const AnyValue& value) {
    const std::size_t keySize = prefix.size() + key.size();
    appendHead(message, tag,
               sizeOfField(key_value::kKey, keySize) +
                   sizeOfField(key_value::kValue, value.size()));
    appendHead(message, key_value::kKey, keySize);
    message.append(prefix).append(key);
    appendHead(message, key_value::kValue, value.size());
    value.appendTo(message);
}

void appendItem(std::string& items, const AnyValue& value) {
    appendHead(items, any_value::kValues, value.size());
    value.appendTo(items);
}

void addText(Writer& writer, Tag tag, std::string_view key, std::string_view text) {
    const std::string valid = isValidUtf8(text) ? std::string(text) : replaceInvalidUtf8(text);
    Writer pair(writer, tag);
    pair.add_string(key_value::kKey, key.data(), key.size());
    Writer(pair, key_value::kValue).add_string(any_value::kString, valid);
}

void addInteger(Writer& writer, Tag tag, std::string_view key, std::int64_t value) {
    Writer pair(writer, tag);
    pair.add_string(key_value::kKey, key.data(), key.size());
    Writer(pair, key_value::kValue).add_int64(any_value::kInt, value);
}

std::uint64_t nanoseconds(double seconds) {
    constexpr double kLargest = 1.8e10; // 2^64 ns are 584 years
    if (!(seconds > 0 && seconds < kLargest)) {
        return 0;
    }
    // In two parts: a double has not the digits for both.
    const double whole = std::floor(seconds);
    return static_cast<std::uint64_t>(whole) * 1'000'000'000U +
           static_cast<std::uint64_t>(std::llround((seconds - whole) * 1e9));
}

} // namespace halyard::exporting::otlp
