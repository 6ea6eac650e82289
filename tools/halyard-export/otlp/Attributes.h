// Attributes of the OpenTelemetry protocol: a key and a value of one of its kinds.
//
// Most of what leaves is attributes, so they are put down in one go, their lengths reckoned
// beforehand, instead of by writers that open messages inside of messages. Values and free
// functions; any thread.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <protozero/pbf_writer.hpp>

#include "otlp/Fields.h"

namespace halyard::exporting::otlp {

using Writer = protozero::pbf_writer;

// An AnyValue. Borrows what is inside.
class AnyValue {
public:
    AnyValue() = default; // nothing
    // Requires UTF-8.
    static AnyValue ofText(std::string_view text) { return {any_value::kString, text}; }
    static AnyValue ofInteger(std::int64_t value);
    static AnyValue ofReal(double value);
    static AnyValue ofBoolean(bool value);
    // Of what appendItem() made.
    static AnyValue ofList(std::string_view items) { return {any_value::kArray, items}; }
    // Of what appendEntry() made.
    static AnyValue ofDictionary(std::string_view entries) {
        return {any_value::kDictionary, entries};
    }

    std::size_t size() const { return headSize_ + tail_.size(); }
    void appendTo(std::string& bytes) const { bytes.append(head_.data(), headSize_).append(tail_); }

private:
    AnyValue(Tag tag, std::string_view tail);
    void put(char byte) { head_[headSize_++] = byte; }
    void putVarint(std::uint64_t value);

    std::array<char, 16> head_{}; // a tag, and a number or the length of what follows
    std::size_t headSize_ = 0;
    std::string_view tail_;
};

// Appends a KeyValue, its key in two parts, as field `tag` of the message that it belongs to.
void appendAttribute(std::string& message, Tag tag, std::string_view prefix, std::string_view key,
                     const AnyValue& value);
inline void appendEntry(std::string& entries, std::string_view key, const AnyValue& value) {
    appendAttribute(entries, any_value::kValues, {}, key, value);
}
void appendItem(std::string& items, const AnyValue& value);

// Texts are UTF-8 there: what is not becomes U+FFFD.
void addText(Writer& writer, Tag tag, std::string_view key, std::string_view text);
void addInteger(Writer& writer, Tag tag, std::string_view key, std::int64_t value);

// Seconds since 1970 in nanoseconds; 0 for what the protocol cannot say.
std::uint64_t nanoseconds(double seconds);

} // namespace halyard::exporting::otlp
