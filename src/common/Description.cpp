#include "common/Description.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <fmt/compile.h>
#include <fmt/format.h>

#include "common/TextScan.h"

namespace halyard {
namespace {

constexpr int kIndent = 4;
constexpr std::size_t kSortedInPlace = 16;

// Room for the longest shortest form of a double, and some.
using DecimalBuffer = std::array<char, 40>;

void appendInteger(std::string& out, const fmt::format_int& digits) {
    out.append(digits.data(), digits.size());
}

constexpr bool isPlain(char c) noexcept {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
           c == '$' || c == '.' || c == ':' || c == '-' || c == '/';
}

constexpr std::array<bool, 256> kPlain = [] {
    std::array<bool, 256> plain{};
    for (std::size_t c = 0; c < plain.size(); ++c) {
        plain[c] = isPlain(static_cast<char>(c));
    }
    return plain;
}();

bool needsQuotes(std::string_view text) noexcept {
    char before = 0;
    for (const char c : text) {
        if (!kPlain[static_cast<unsigned char>(c)] || (c == '/' && before == '/')) {
            return true;
        }
        before = c;
    }
    return text.empty();
}

void appendEscaped(std::string& out, char c) {
    switch (c) {
    case '"':
        out += "\\\"";
        break;
    case '\\':
        out += "\\\\";
        break;
    case '\n':
        out += "\\n";
        break;
    case '\r':
        out += "\\r";
        break;
    case '\t':
        out += "\\t";
        break;
    default:
        fmt::format_to(std::back_inserter(out), "\\{:03o}", static_cast<unsigned>(c));
    }
}

void appendQuoted(std::string& out, std::string_view text) {
    out += '"';
    while (!text.empty()) {
        const std::size_t plain = plainLength<'\x7F', '"', '\\'>(text);
        out += text.substr(0, plain);
        if (plain < text.size()) {
            appendEscaped(out, text[plain]);
        }
        text.remove_prefix(std::min(plain + 1, text.size()));
    }
    out += '"';
}

void appendNested(std::string& out, const Value& value, int depth);

void appendText(std::string& out, std::string_view text) {
    if (needsQuotes(text)) {
        appendQuoted(out, text);
    } else {
        out += text;
    }
}

void appendElement(std::string& out, const Value& value, int depth) {
    if (value.isList() || value.isDictionary()) {
        appendNested(out, value, depth);
        return;
    }
    if (value.isString()) {
        appendText(out, value.text());
        return;
    }
    const std::size_t start = out.size();
    appendDescription(out, value);
    if (value.isInteger()) {
        return; // Always plain.
    }
    const std::string_view text = std::string_view(out).substr(start);
    if (needsQuotes(text)) { // A date, or a number with a "+" in it.
        const std::string copy(text);
        out.resize(start);
        appendQuoted(out, copy);
    }
}

// Every message is described, and most dictionaries within messages are small.
template <class Body>
void forEachSorted(std::span<const Dictionary::Entry> entries, const Body& body) {
    if (entries.size() > kSortedInPlace) {
        for (const auto* entry : sortedEntries(entries)) {
            body(*entry);
        }
        return;
    }
    std::array<const Dictionary::Entry*, kSortedInPlace> sorted;
    const auto end = std::transform(entries.begin(), entries.end(), sorted.begin(),
                                    [](const Dictionary::Entry& entry) { return &entry; });
    std::sort(sorted.begin(), end, [](const auto* left, const auto* right) {
        return left->key.text() < right->key.text();
    });
    std::for_each(sorted.begin(), end, [&](const auto* entry) { body(*entry); });
}

void appendNested(std::string& out, const Value& value, int depth) {
    const auto outer = static_cast<std::size_t>(depth * kIndent);
    const std::size_t inner = outer + kIndent;
    if (value.isList()) {
        out += "(\n";
        const std::span<const Value> list = List::itemsOf(value);
        for (std::size_t i = 0; i < list.size(); ++i) {
            out.append(inner, ' ');
            appendElement(out, list[i], depth + 1);
            out += i + 1 < list.size() ? ",\n" : "\n";
        }
        out.append(outer, ' ').append(")");
        return;
    }
    out += "{\n";
    forEachSorted(Dictionary::entriesOf(value), [&](const Dictionary::Entry& entry) {
        out.append(inner, ' ');
        appendElement(out, entry.key, depth + 1);
        out += " = ";
        appendElement(out, entry.value, depth + 1);
        out += ";\n";
    });
    out.append(outer, ' ').append("}");
}

template <class Real> std::string_view shortest(Real value, DecimalBuffer& buffer) {
    const auto end = fmt::format_to(buffer.data(), FMT_COMPILE("{}"), value);
    return {buffer.data(), static_cast<std::size_t>(end - buffer.data())};
}

struct CivilTime {
    std::int64_t year;
    unsigned month;
    unsigned day;
    int hour;
    int minute;
    int second;
};

CivilTime civilTime(std::int64_t seconds) {
    constexpr std::int64_t kDay = 86400;
    // Years 0000 to 9999, the range of a four-digit year.
    constexpr std::int64_t kFirst = -62'167'219'200;
    constexpr std::int64_t kLast = 253'402'300'799;
    seconds = std::clamp(seconds, kFirst, kLast);
    std::int64_t days = seconds / kDay;
    std::int64_t rest = seconds % kDay;
    if (rest < 0) {
        rest += kDay;
        --days;
    }
    const std::chrono::year_month_day date{
        std::chrono::sys_days{std::chrono::days{static_cast<std::int32_t>(days)}}};
    return {static_cast<int>(date.year()),     static_cast<unsigned>(date.month()),
            static_cast<unsigned>(date.day()), static_cast<int>(rest / 3600),
            static_cast<int>(rest / 60 % 60),  static_cast<int>(rest % 60)};
}

} // namespace

std::string shortestDecimal(double value) {
    DecimalBuffer buffer;
    return std::string(shortest(value, buffer));
}

std::string shortestDecimal(float value) {
    DecimalBuffer buffer;
    return std::string(shortest(value, buffer));
}

std::string describe(Date date) {
    const CivilTime t = civilTime(date.seconds);
    return fmt::format("{:04}-{:02}-{:02} {:02}:{:02}:{:02} +0000", t.year, t.month, t.day, t.hour,
                       t.minute, t.second);
}

std::string rfc3339(Date date) {
    const CivilTime t = civilTime(date.seconds);
    std::string text = fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}", t.year, t.month, t.day,
                                   t.hour, t.minute, t.second);
    if (date.nanoseconds != 0) {
        text += fmt::format(".{:09}", date.nanoseconds);
        text.erase(text.find_last_not_of('0') + 1);
    }
    return text + 'Z';
}

void appendDescription(std::string& out, const Value& value) {
    DecimalBuffer buffer;
    switch (value.kind()) {
    case Value::Kind::None:
        out += "(null)";
        break;
    case Value::Kind::Bool:
    case Value::Kind::Int:
        appendInteger(out, fmt::format_int(value.integerValue()));
        break;
    case Value::Kind::UInt:
        appendInteger(out, fmt::format_int(value.unsignedValue()));
        break;
    case Value::Kind::Float:
        out += shortest(value.floatValue(), buffer);
        break;
    case Value::Kind::Double:
        out += shortest(value.doubleValue(), buffer);
        break;
    case Value::Kind::String:
        out += value.text();
        break;
    case Value::Kind::Date:
        out += describe(value.date());
        break;
    case Value::Kind::List:
    case Value::Kind::Dictionary:
        appendNested(out, value, 0);
        break;
    }
}

std::string shortened(std::string text, std::size_t limit) {
    if (text.size() <= limit) {
        return text;
    }
    std::size_t kept = limit;
    while (kept > 0 && (static_cast<unsigned char>(text[kept]) & 0xC0U) == 0x80U) {
        --kept;
    }
    const std::size_t left = text.size() - kept;
    text.resize(kept);
    return text + fmt::format("... ({} bytes more)", left);
}

std::string describe(const Value& value) {
    std::string out;
    appendDescription(out, value);
    return out;
}

} // namespace halyard
