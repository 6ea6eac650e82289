#include "common/Json.h"

#include <cmath>
#include <fmt/format.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>

#include "common/Description.h"
#include "common/Utf8.h"

namespace halyard {
namespace {

template <class Writer> void writeText(Writer& writer, std::string_view text) {
    if (!isValidUtf8(text)) {
        writeText(writer, replaceInvalidUtf8(text));
        return;
    }
    writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
}

template <class Writer, class Real> void writeReal(Writer& writer, Real value) {
    if (std::isnan(value)) {
        writeText(writer, "NaN");
    } else if (std::isinf(value)) {
        writeText(writer, value > 0 ? "Infinity" : "-Infinity");
    } else {
        fmt::memory_buffer digits;
        fmt::format_to(fmt::appender(digits), "{}", value);
        writer.RawValue(digits.data(), digits.size(), rapidjson::kNumberType);
    }
}

template <class Writer> void writeValue(Writer& writer, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        writer.Null();
        break;
    case Value::Kind::Bool:
        writer.Bool(value.integerValue() != 0);
        break;
    case Value::Kind::Int:
        writer.Int64(value.integerValue());
        break;
    case Value::Kind::UInt:
        writer.Uint64(value.unsignedValue());
        break;
    case Value::Kind::Float:
        writeReal(writer, value.floatValue());
        break;
    case Value::Kind::Double:
        writeReal(writer, value.doubleValue());
        break;
    case Value::Kind::String:
        writeText(writer, value.text());
        break;
    case Value::Kind::Date:
        writeText(writer, rfc3339(value.date()));
        break;
    case Value::Kind::List:
        writer.StartArray();
        for (const Value& item : List::itemsOf(value)) {
            writeValue(writer, item);
        }
        writer.EndArray();
        break;
    case Value::Kind::Dictionary:
        writer.StartObject();
        for (const auto& entry : Dictionary::entriesOf(value)) {
            writeText(writer, entry.key.text());
            writeValue(writer, entry.value);
        }
        writer.EndObject();
        break;
    }
}

std::string_view contents(const rapidjson::StringBuffer& buffer) {
    return {buffer.GetString(), buffer.GetSize()};
}

} // namespace

std::string toJson(const Value& value) {
    JsonWriter writer;
    return std::string(writer.write(value));
}

std::string toPrettyJson(const Value& value) {
    rapidjson::StringBuffer buffer;
    rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
    writer.SetIndent(' ', 2);
    writeValue(writer, value);
    return std::string(contents(buffer));
}

} // namespace halyard
