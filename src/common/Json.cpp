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
class CompactText {
public:
    void clear() { size_ = 0; }
    void shrink() {
        if (buffer_.size() > kKeptBytes) {
            buffer_ = std::vector<char>(kFirstBytes);
        }
        size_ = 0;
    }
    std::size_t capacity() const { return buffer_.size(); }
    std::string_view text() const { return {buffer_.data(), size_}; }
    void write(const Value& value);
    void write(std::span<const Dictionary::Entry> entries);

private:
    static constexpr std::size_t kFirstBytes = 1024;
    static constexpr std::size_t kKeptBytes = 64 * 1024;

    // Makes room behind what is written. Never null.
    char* room(std::size_t bytes) {
        if (buffer_.size() - size_ < bytes) {
            buffer_.resize(std::max(buffer_.size() * 2, size_ + bytes));
        }
        return buffer_.data() + size_;
    }
    void put(char c) {
        *room(1) = c;
        ++size_;
    }
    void append(std::string_view text) {
        std::memcpy(room(text.size()), text.data(), text.size());
        size_ += text.size();
    }
    void writeText(std::string_view text);
    void writeEscaped(std::string_view text);
    void write(std::span<const Value> items);
    template <class Real> void writeReal(Real value);

    std::vector<char> buffer_ = std::vector<char>(kFirstBytes);
    std::size_t size_ = 0;
};

void CompactText::writeText(std::string_view text) {
    if (!isPlain(text)) {
        writeEscaped(text);
        return;
    }
    char* at = room(text.size() + 2);
    *at = '"';
    std::memcpy(at + 1, text.data(), text.size());
    at[text.size() + 1] = '"';
    size_ += text.size() + 2;
}

void CompactText::writeEscaped(std::string_view text) {
    if (!isValidUtf8(text)) {
        writeEscaped(replaceInvalidUtf8(text));
        return;
    }
    put('"');
    for (const char c : text) {
        constexpr std::string_view kNamed = "\"\\\b\f\n\r\t";
        constexpr std::string_view kNames = "\"\\bfnrt";
        if (const std::size_t named = kNamed.find(c); named != std::string_view::npos) {
            put('\\');
            put(kNames[named]);
        } else if (static_cast<unsigned char>(c) < 0x20) {
            constexpr std::string_view kDigits = "0123456789ABCDEF";
            append("\\u00");
            put(kDigits[static_cast<unsigned char>(c) / 16]);
            put(kDigits[static_cast<unsigned char>(c) % 16]);
        } else {
            put(c);
        }
    }
    put('"');
}

template <class Real> void CompactText::writeReal(Real value) {
    constexpr std::size_t kLongest = 40;
    if (std::isfinite(value)) {
        char* const at = room(kLongest);
        size_ += static_cast<std::size_t>(fmt::format_to(at, FMT_COMPILE("{}"), value) - at);
    } else {
        writeText(std::isnan(value) ? "NaN" : value > 0 ? "Infinity" : "-Infinity");
    }
}

void CompactText::write(std::span<const Value> items) {
    put('[');
    for (std::size_t i = 0; i < items.size(); ++i) {
        if (i > 0) {
            put(',');
        }
        write(items[i]);
    }
    put(']');
}

void CompactText::write(std::span<const Dictionary::Entry> entries) {
    put('{');
    for (std::size_t i = 0; i < entries.size(); ++i) {
        if (i > 0) {
            put(',');
        }
        writeText(entries[i].key.text());
        put(':');
        write(entries[i].value);
    }
    put('}');
}

void CompactText::write(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        return append("null");
    case Value::Kind::Bool:
        return append(value.integerValue() != 0 ? "true" : "false");
    case Value::Kind::Int: {
        const fmt::format_int digits(value.integerValue());
        return append({digits.data(), digits.size()});
    }
    case Value::Kind::UInt: {
        const fmt::format_int digits(value.unsignedValue());
        return append({digits.data(), digits.size()});
    }
    case Value::Kind::Float:
        return writeReal(value.floatValue());
    case Value::Kind::Double:
        return writeReal(value.doubleValue());
    case Value::Kind::String:
        return writeText(value.text());
    case Value::Kind::Date:
        return writeText(rfc3339(value.date()));
    case Value::Kind::List:
        return write(List::itemsOf(value));
    case Value::Kind::Dictionary:
        return write(Dictionary::entriesOf(value));
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

void JsonWriter::shrink() {
    buffer_->text.shrink();
}

std::size_t JsonWriter::capacity() const {
    return buffer_->text.capacity();
}

} // namespace halyard
