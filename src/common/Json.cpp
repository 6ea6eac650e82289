#include "common/Json.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <fmt/compile.h>
#include <fmt/format.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>
#include <span>
#include <vector>

#include "common/Description.h"
#include "common/Utf8.h"

namespace halyard {
namespace {

// Whether a text is ASCII of which nothing has to be escaped, eight bytes at a time.
bool isPlain(std::string_view text) noexcept {
    constexpr std::uint64_t kEach = 0x0101010101010101U;
    constexpr std::uint64_t kHighs = 0x80 * kEach;
    const auto hasZero = [](std::uint64_t word) { return (word - kEach) & ~word; };
    std::uint64_t special = 0;
    const auto look = [&](std::uint64_t word) {
        special |= word | ((word - 0x20 * kEach) & ~word) | hasZero(word ^ ('"' * kEach)) |
                   hasZero(word ^ ('\\' * kEach));
    };
    std::size_t at = 0;
    for (; at + 8 <= text.size(); at += 8) {
        std::uint64_t word = 0;
        std::memcpy(&word, text.data() + at, 8);
        look(word);
    }
    if (at < text.size()) {
        std::uint64_t rest = 0x20 * kEach;
        std::memcpy(&rest, text.data() + at, text.size() - at);
        look(rest);
    }
    return (special & kHighs) == 0;
}

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

// The compact form, which the store writes of every message, without RapidJSON:
// that looks at each byte of a text twice more than needed.
//
// There is always room for kSlack bytes, so that numbers and what stands between values
// are written without looking; whatever uses some of it makes room anew.
class CompactText {
public:
    CompactText() = default;
    CompactText(const CompactText&) = delete;
    CompactText& operator=(const CompactText&) = delete;

    void clear() { at_ = buffer_.data(); }
    void shrink() {
        if (buffer_.size() > kKeptBytes) {
            buffer_ = std::vector<char>(kFirstBytes);
        }
        clear();
    }
    std::size_t capacity() const { return buffer_.size(); }
    std::string_view text() const {
        return {buffer_.data(), static_cast<std::size_t>(at_ - buffer_.data())};
    }
    void write(const Value& value);
    void write(std::span<const Dictionary::Entry> entries);
    void write(std::span<const Dictionary::Entry> entries, const Dictionary::Entry& top);

private:
    static constexpr std::size_t kFirstBytes = 1024;
    static constexpr std::size_t kKeptBytes = 64 * 1024;
    // The longest number and some signs.
    static constexpr std::size_t kSlack = 64;

    // Makes room for so many bytes beside the slack.
    void need(std::size_t bytes) {
        const auto size = static_cast<std::size_t>(at_ - buffer_.data());
        if (buffer_.size() - size < bytes + kSlack) {
            buffer_.resize(std::max(buffer_.size() * 2, size + bytes + kFirstBytes));
            at_ = buffer_.data() + size;
        }
    }
    void put(char c) { *at_++ = c; }
    // Requires room.
    void append(std::string_view text) {
        std::memcpy(at_, text.data(), text.size());
        at_ += text.size();
    }
    void append(const fmt::format_int& digits) { append({digits.data(), digits.size()}); }
    void writeText(std::string_view text);
    void writeEscaped(std::string_view text);
    void escape(char c);
    void write(std::span<const Value> items);
    void writeEntry(const Value& key, const Value& value);
    void close(char opened, char closing);
    template <class Real> void writeReal(Real value);

    std::vector<char> buffer_ = std::vector<char>(kFirstBytes);
    char* at_ = buffer_.data();
};

void CompactText::writeText(std::string_view text) {
    if (!isPlain(text)) {
        writeEscaped(text);
        return;
    }
    need(text.size());
    put('"');
    append(text);
    put('"');
}

void CompactText::escape(char c) {
    constexpr std::string_view kNamed = "\"\\\b\f\n\r\t";
    constexpr std::string_view kNames = "\"\\bfnrt";
    if (const std::size_t named = kNamed.find(c); named != std::string_view::npos) {
        put('\\');
        put(kNames[named]);
    } else {
        constexpr std::string_view kDigits = "0123456789ABCDEF";
        append("\\u00");
        put(kDigits[static_cast<unsigned char>(c) / 16]);
        put(kDigits[static_cast<unsigned char>(c) % 16]);
    }
}

void CompactText::writeEscaped(std::string_view text) {
    if (!isValidUtf8(text)) {
        writeEscaped(replaceInvalidUtf8(text));
        return;
    }
    const auto isLiteral = [](char c) {
        return static_cast<unsigned char>(c) >= 0x20 && c != '"' && c != '\\';
    };
    need(text.size());
    put('"');
    while (!text.empty()) {
        const auto plain = static_cast<std::size_t>(
            std::find_if_not(text.begin(), text.end(), isLiteral) - text.begin());
        append(text.substr(0, plain));
        if (plain < text.size()) {
            escape(text[plain]);
        }
        text.remove_prefix(std::min(plain + 1, text.size()));
        need(text.size());
    }
    put('"');
}

template <class Real> void CompactText::writeReal(Real value) {
    if (std::isfinite(value)) {
        at_ = fmt::format_to(at_, FMT_COMPILE("{}"), value);
    } else {
        writeText(std::isnan(value) ? "NaN" : value > 0 ? "Infinity" : "-Infinity");
    }
}

// In the place of the comma behind the last, if there is any.
void CompactText::close(char opened, char closing) {
    at_ -= at_[-1] == opened ? 0 : 1;
    put(closing);
}

void CompactText::write(std::span<const Value> items) {
    need(0);
    put('[');
    for (const Value& item : items) {
        write(item);
        put(',');
    }
    close('[', ']');
}

void CompactText::writeEntry(const Value& key, const Value& value) {
    writeText(key.text());
    put(':');
    write(value);
    put(',');
}

void CompactText::write(std::span<const Dictionary::Entry> entries) {
    need(0);
    put('{');
    for (const Dictionary::Entry& entry : entries) {
        writeEntry(entry.key, entry.value);
    }
    close('{', '}');
}

void CompactText::write(std::span<const Dictionary::Entry> entries, const Dictionary::Entry& top) {
    put('{');
    bool isThere = top.value.isNone();
    for (const Dictionary::Entry& entry : entries) {
        if (!(entry.key == top.key)) {
            writeEntry(entry.key, entry.value);
        } else if (!top.value.isNone()) {
            writeEntry(top.key, top.value);
            isThere = true;
        }
    }
    if (!isThere) {
        writeEntry(top.key, top.value);
    }
    close('{', '}');
}

void CompactText::write(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        append("null");
        break;
    case Value::Kind::Bool:
        append(value.integerValue() != 0 ? "true" : "false");
        break;
    case Value::Kind::Int:
        append(fmt::format_int(value.integerValue()));
        break;
    case Value::Kind::UInt:
        append(fmt::format_int(value.unsignedValue()));
        break;
    case Value::Kind::Float:
        writeReal(value.floatValue());
        break;
    case Value::Kind::Double:
        writeReal(value.doubleValue());
        break;
    case Value::Kind::String:
        writeText(value.text());
        break;
    case Value::Kind::Date:
        writeText(rfc3339(value.date()));
        break;
    case Value::Kind::List:
        write(List::itemsOf(value));
        break;
    case Value::Kind::Dictionary:
        write(Dictionary::entriesOf(value));
        break;
    }
    need(0);
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

struct JsonWriter::Buffer {
    CompactText text;
};

JsonWriter::JsonWriter() : buffer_(std::make_unique<Buffer>()) {}
JsonWriter::~JsonWriter() = default;

std::string_view JsonWriter::write(const Value& value) {
    buffer_->text.clear();
    buffer_->text.write(value);
    return buffer_->text.text();
}

std::string_view JsonWriter::write(const Dictionary& value) {
    buffer_->text.clear();
    buffer_->text.write({value.begin(), value.end()});
    return buffer_->text.text();
}

std::string_view JsonWriter::write(const Dictionary& value, const Dictionary::Entry& top) {
    buffer_->text.clear();
    buffer_->text.write({value.begin(), value.end()}, top);
    return buffer_->text.text();
}

void JsonWriter::shrink() {
    buffer_->text.shrink();
}

std::size_t JsonWriter::capacity() const {
    return buffer_->text.capacity();
}

} // namespace halyard
