// Values as JSON text, for the store and the summary files.
//
// Numbers take their shortest round-trip form, 64-bit integers stay exact, dates
// are RFC 3339 UTC strings, not-a-number and infinities the strings "NaN",
// "Infinity" and "-Infinity"; ill-formed UTF-8 becomes U+FFFD.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "common/Value.h"

namespace halyard {

std::string toJson(const Value& value);
std::string toPrettyJson(const Value& value);

// Writes one value after the other into a buffer it keeps, for callers that
// write many. Not thread-safe.
class JsonWriter {
public:
    JsonWriter();
    ~JsonWriter();
    JsonWriter(const JsonWriter&) = delete;
    JsonWriter& operator=(const JsonWriter&) = delete;

    // Valid until the next call.
    std::string_view write(const Value& value);
    std::string_view write(const Dictionary& value);
    // As it would be had `top` been set in it; a value of none leaves the key out.
    std::string_view write(const Dictionary& value, const Dictionary::Entry& top);

    // The same for messages of which several texts are asked for, each with other entries
    // behind or on top: what they have in common is written once. Requires that they live
    // until forget().
    std::string_view writeShared(const Dictionary& value);
    std::string_view writeShared(const Dictionary& value, const Dictionary::Entry& top);
    void forget();

    // Lets go of the room that an unusually long text took.
    void shrink();
    std::size_t capacity() const;

private:
    struct Buffer;
    std::unique_ptr<Buffer> buffer_;
};

} // namespace halyard
