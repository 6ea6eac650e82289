// The compact form, which the store writes of every message.
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <fmt/compile.h>
#include <fmt/format.h>
#include <span>
#include <vector>

#include "common/Description.h"
#include "common/Json.h"
#include "common/KeptTexts.h"
#include "common/TextScan.h"
#include "common/Utf8.h"

namespace halyard {
namespace {

// Copies a text, eight bytes at a time. True when it is ASCII of which nothing has to be
// escaped; else what was copied is worth nothing. Requires room for the text.
bool copyPlain(char* to, std::string_view text) noexcept {
    constexpr std::uint64_t kEach = 0x0101010101010101U;
    constexpr std::uint64_t kHighs = 0x80 * kEach;
    const auto hasZero = [](std::uint64_t word) { return (word - kEach) & ~word; };
    std::uint64_t special = 0;
    const auto copy = [&](std::size_t at, auto word) {
        std::memcpy(&word, text.data() + at, sizeof word);
        std::memcpy(to + at, &word, sizeof word);
        return word;
    };
    const auto look = [&](std::uint64_t word) {
        special |= word | ((word - 0x20 * kEach) & ~word) | hasZero(word ^ ('"' * kEach)) |
                   hasZero(word ^ ('\\' * kEach));
    };
    const std::size_t size = text.size();
    if (size >= 8) { // The last eight may be looked at twice.
        for (std::size_t at = 0; at + 8 < size; at += 8) {
            look(copy(at, std::uint64_t{}));
        }
        look(copy(size - 8, std::uint64_t{}));
    } else if (size >= 4) {
        const std::uint64_t first = copy(0, std::uint32_t{});
        look(first | (std::uint64_t{copy(size - 4, std::uint32_t{})} << 32U));
    } else if (size > 0) {
        constexpr std::uint64_t kBlanks = 0x20 * (kEach << 24U);
        const std::uint64_t first = copy(0, std::uint8_t{});
        const std::uint64_t middle = copy(size / 2, std::uint8_t{});
        look(first | middle << 8U | std::uint64_t{copy(size - 1, std::uint8_t{})} << 16U | kBlanks);
    }
    return (special & kHighs) == 0;
}

// Writes without RapidJSON: that looks at each byte of a text twice more than needed.
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
    // The same piece by piece: open(), entries and texts of entries, close().
    void open();
    void writeEntries(std::span<const Dictionary::Entry> entries);
    void writeEntry(const Value& key, const Value& value);
    void appendEntries(std::string_view text) {
        need(text.size());
        append(text);
    }
    void close() { close('{', '}'); }

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
    void close(char opened, char closing);
    template <class Real> void writeReal(Real value);

    std::vector<char> buffer_ = std::vector<char>(kFirstBytes);
    char* at_ = buffer_.data();
};

void CompactText::writeText(std::string_view text) {
    need(text.size());
    if (!copyPlain(at_ + 1, text)) {
        writeEscaped(text);
        return;
    }
    put('"');
    at_ += text.size();
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
    need(text.size());
    put('"');
    while (!text.empty()) {
        const std::size_t plain = plainLength<'"', '\\'>(text);
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

void CompactText::open() {
    need(0);
    put('{');
}

void CompactText::writeEntries(std::span<const Dictionary::Entry> entries) {
    for (const Dictionary::Entry& entry : entries) {
        writeEntry(entry.key, entry.value);
    }
}

void CompactText::write(std::span<const Dictionary::Entry> entries) {
    open();
    writeEntries(entries);
    close();
}

void CompactText::write(std::span<const Dictionary::Entry> entries, const Dictionary::Entry& top) {
    open();
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
    close();
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

} // namespace

struct JsonWriter::Buffer {
    // The first entries of a message are as they were decoded, whoever has put another
    // behind them.
    std::string_view writeShared(const Dictionary& value, const Dictionary::Entry* top);

    CompactText text;
    KeptTexts kept;
};

std::string_view JsonWriter::Buffer::writeShared(const Dictionary& value,
                                                 const Dictionary::Entry* top) {
    const std::span<const Dictionary::Entry> entries(value.begin(), value.end());
    const detail::DictionaryBlock* const block = detail::BlockOf::dictionary(value);
    const std::size_t common = block != nullptr && block->isShared() ? block->fixed : 0;
    text.clear();
    if (common == 0 || common > entries.size() ||
        (top != nullptr && value.contains(top->key.text()))) {
        top != nullptr ? text.write(entries, *top) : text.write(entries);
        return text.text();
    }
    text.open();
    if (const std::string_view known = kept.find(block); !known.empty()) {
        text.appendEntries(known);
    } else {
        text.writeEntries(entries.first(common));
        kept.keep(block, text.text().substr(1));
    }
    text.writeEntries(entries.subspan(common));
    if (top != nullptr && !top->value.isNone()) {
        text.writeEntry(top->key, top->value);
    }
    text.close();
    return text.text();
}

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

std::string_view JsonWriter::writeShared(const Dictionary& value) {
    return buffer_->writeShared(value, nullptr);
}

std::string_view JsonWriter::writeShared(const Dictionary& value, const Dictionary::Entry& top) {
    return buffer_->writeShared(value, &top);
}

void JsonWriter::forget() {
    buffer_->kept.forget();
}

void JsonWriter::shrink() {
    buffer_->text.shrink();
}

std::size_t JsonWriter::capacity() const {
    return buffer_->text.capacity();
}

} // namespace halyard
