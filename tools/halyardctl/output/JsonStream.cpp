#include "output/JsonStream.h"

#include <cmath>
#include <fmt/format.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <utility>

#include "common/Json.h"
#include "common/Utf8.h"
#include "output/Sanitise.h"

namespace halyard::ctl {

// What the parser of a text finds, written. A text is parsed twice, first for whether
// it is JSON at all: what has been written cannot be taken back.
struct JsonStream::PassThrough {
    JsonStream& to;

    bool Null() { return to.writer_.Null(); }
    bool Bool(bool value) { return to.writer_.Bool(value); }
    bool Int(int) { return false; }
    bool Uint(unsigned) { return false; }
    bool Int64(std::int64_t) { return false; }
    bool Uint64(std::uint64_t) { return false; }
    bool Double(double) { return false; }
    bool RawNumber(const char* digits, rapidjson::SizeType length, bool) {
        to.writeRaw({digits, length}, rapidjson::kNumberType);
        return true;
    }
    bool String(const char* text, rapidjson::SizeType length, bool) {
        to.writeText({text, length});
        return true;
    }
    bool StartObject() { return to.writer_.StartObject(); }
    bool Key(const char* text, rapidjson::SizeType length, bool copy) {
        return String(text, length, copy);
    }
    bool EndObject(rapidjson::SizeType) { return to.writer_.EndObject(); }
    bool StartArray() { return to.writer_.StartArray(); }
    bool EndArray(rapidjson::SizeType) { return to.writer_.EndArray(); }
};

namespace {

// Deeper than any message may be. What is below it is left out: the depth of a text
// from outside must not become the depth of our stack.
constexpr int kDeepest = 64;

constexpr unsigned kFlags = rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;

template <class Handler> bool parse(std::string_view text, Handler& handler) {
    rapidjson::MemoryStream bytes(text.data(), text.size());
    rapidjson::Reader reader;
    return !reader.Parse<kFlags>(bytes, handler).IsError();
}

void appendEscape(std::string& out, char32_t code) {
    const auto unit = [&out](unsigned value) { out += fmt::format("\\u{:04x}", value); };
    if (code < 0x10000) {
        unit(static_cast<unsigned>(code));
    } else {
        const auto rest = static_cast<unsigned>(code - 0x10000);
        unit(0xD800 + (rest >> 10));
        unit(0xDC00 + (rest & 0x3FF));
    }
}

bool isPlain(char c) {
    return c >= 0x20 && c < 0x7F && c != '"' && c != '\\';
}

} // namespace

void JsonStream::appendQuoted(std::string& out, std::string_view text) {
    out += '"';
    const std::string valid = isValidUtf8(text) ? std::string() : replaceInvalidUtf8(text);
    const std::string_view from = valid.empty() ? text : valid;
    for (std::size_t at = 0; at < from.size();) {
        if (isPlain(from[at])) {
            out += from[at++];
            continue;
        }
        const std::size_t begin = at;
        const char32_t code = nextCodePoint(from, at);
        if (code == '"' || code == '\\') {
            out.append({'\\', static_cast<char>(code)});
        } else if (code == '\n') {
            out += "\\n";
        } else if (isUnsafe(code)) {
            appendEscape(out, code);
        } else {
            out.append(from, begin, at - begin);
        }
    }
    out += '"';
}

void JsonStream::endList() {
    for (const char c : std::string_view("\n]\n")) {
        bytes_.Put(c);
    }
}

void JsonStream::beginElement() {
    if (std::exchange(any_, true)) {
        bytes_.Put(',');
    }
    bytes_.Put('\n');
    writer_.Reset(bytes_);
}

void JsonStream::writeText(std::string_view value) {
    buffer_.clear();
    appendQuoted(buffer_, value);
    writeRaw(buffer_, rapidjson::kStringType);
}

void JsonStream::real(double value) {
    if (!std::isfinite(value)) {
        return null();
    }
    writeRaw(fmt::format("{}", value), rapidjson::kNumberType);
}

void JsonStream::json(std::string_view text) {
    rapidjson::BaseReaderHandler<> nobody;
    if (!isValidUtf8(text) || !parse(text, nobody)) {
        return null();
    }
    PassThrough through{*this};
    parse(text, through);
}

void JsonStream::write(const rapidjson::Value& value, int depth) {
    const bool tooDeep = depth > kDeepest;
    switch (tooDeep ? rapidjson::kNullType : value.GetType()) {
    case rapidjson::kObjectType:
        beginObject();
        for (const auto& entry : value.GetObject()) {
            key({entry.name.GetString(), entry.name.GetStringLength()});
            write(entry.value, depth + 1);
        }
        return endObject();
    case rapidjson::kArrayType:
        beginArray();
        for (const rapidjson::Value& item : value.GetArray()) {
            write(item, depth + 1);
        }
        return endArray();
    case rapidjson::kStringType:
        return text({value.GetString(), value.GetStringLength()});
    case rapidjson::kNumberType:
        return value.IsInt64()    ? integer(value.GetInt64())
               : value.IsUint64() ? count(value.GetUint64())
                                  : real(value.GetDouble());
    case rapidjson::kNullType:
        return null();
    default:
        return boolean(value.GetBool());
    }
}

void JsonStream::value(const Value& value) {
    json(toJson(value));
}

void JsonStream::field(std::string_view name, const char* value) {
    key(name);
    value == nullptr ? null() : text(value);
}

void JsonStream::field(std::string_view name, const std::optional<std::string>& value) {
    key(name);
    value ? text(*value) : null();
}

void JsonStream::field(std::string_view name, std::optional<std::int64_t> value) {
    key(name);
    value ? integer(*value) : null();
}

void JsonStream::field(std::string_view name, std::optional<double> value) {
    key(name);
    value ? real(*value) : null();
}

void JsonStream::countField(std::string_view name, std::uint64_t value) {
    key(name);
    count(value);
}

void JsonStream::jsonField(std::string_view name, std::string_view text) {
    key(name);
    json(text);
}

} // namespace halyard::ctl
