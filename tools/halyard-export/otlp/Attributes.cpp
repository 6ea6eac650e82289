#include "otlp/Attributes.h"

#include <cmath>

#include "common/Utf8.h"

namespace halyard::exporting::otlp {
namespace {

void appendKeyValue(Writer& writer, Tag tag, std::string_view key, std::string_view any) {
    Writer pair(writer, tag);
    pair.add_string(key_value::kKey, key.data(), key.size());
    // Written whole: a nested writer takes an empty message back.
    pair.add_message(key_value::kValue, any.data(), any.size());
}

} // namespace

void appendText(std::string& any, std::string_view text) {
    Writer writer(any);
    if (isValidUtf8(text)) {
        writer.add_string(any_value::kString, text.data(), text.size());
    } else {
        writer.add_string(any_value::kString, replaceInvalidUtf8(text));
    }
}

void appendInteger(std::string& any, std::int64_t value) {
    Writer(any).add_int64(any_value::kInt, value);
}

void appendReal(std::string& any, double value) {
    Writer(any).add_double(any_value::kDouble, value);
}

void appendBoolean(std::string& any, bool value) {
    Writer(any).add_bool(any_value::kBool, value);
}

void addAny(Writer& writer, Tag tag, std::string_view key, std::string_view value) {
    appendKeyValue(writer, tag, key, value);
}

void addText(Writer& writer, Tag tag, std::string_view key, std::string_view text) {
    std::string any;
    appendText(any, text);
    appendKeyValue(writer, tag, key, any);
}

void addInteger(Writer& writer, Tag tag, std::string_view key, std::int64_t value) {
    std::string any;
    appendInteger(any, value);
    appendKeyValue(writer, tag, key, any);
}

void addReal(Writer& writer, Tag tag, std::string_view key, double value) {
    std::string any;
    appendReal(any, value);
    appendKeyValue(writer, tag, key, any);
}

void addBoolean(Writer& writer, Tag tag, std::string_view key, bool value) {
    std::string any;
    appendBoolean(any, value);
    appendKeyValue(writer, tag, key, any);
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
