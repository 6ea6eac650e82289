#include "common/PropertyListText.h"

#include <algorithm>
#include <fmt/format.h>
#include <string>
#include <utility>

namespace halyard {
namespace {

struct Broken {
    std::string_view what;
};

bool isSpace(char c) noexcept {
    return c == ' ' || (c >= '\t' && c <= '\r');
}

// What an unquoted string is made of: a little more than the writer leaves
// unquoted, since people leave out quotes where they can.
bool isPlain(char c) noexcept {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::string_view("_$.:-/+*#@!?&%").find(c) != std::string_view::npos;
}

int hexDigit(char c) noexcept {
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    const char lower = static_cast<char>(c | 0x20);
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

void appendUtf8(std::string& out, std::uint32_t code) {
    const auto byte = [&out](std::uint32_t value) { out += static_cast<char>(value); };
    if (code < 0x80) {
        byte(code);
    } else if (code < 0x800) {
        byte(0xC0 | code >> 6);
        byte(0x80 | (code & 0x3F));
    } else if (code < 0x10000) {
        byte(0xE0 | code >> 12);
        byte(0x80 | (code >> 6 & 0x3F));
        byte(0x80 | (code & 0x3F));
    } else {
        byte(0xF0 | code >> 18);
        byte(0x80 | (code >> 12 & 0x3F));
        byte(0x80 | (code >> 6 & 0x3F));
        byte(0x80 | (code & 0x3F));
    }
}

class Reader {
public:
    explicit Reader(std::string_view text) : text_(text) {}

    // Throws Broken.
    Value whole() {
        skipBlank();
        if (atEnd()) {
            throw Broken{"the text is empty"};
        }
        Value result = value(0);
        skipBlank();
        if (!atEnd()) {
            throw Broken{"there is something after the value"};
        }
        return result;
    }

    std::size_t line() const {
        const auto read = text_.substr(0, at_);
        return 1 + static_cast<std::size_t>(std::count(read.begin(), read.end(), '\n'));
    }

private:
    bool atEnd() const { return at_ >= text_.size(); }
    char peek(std::size_t ahead = 0) const {
        return at_ + ahead < text_.size() ? text_[at_ + ahead] : '\0';
    }
    bool take(char expected) {
        if (atEnd() || peek() != expected) {
            return false;
        }
        ++at_;
        return true;
    }
    bool takeAfterBlank(char expected) {
        skipBlank();
        return take(expected);
    }

    void skipBlank() {
        for (;;) {
            if (!atEnd() && isSpace(peek())) {
                ++at_;
            } else if (peek() == '/' && peek(1) == '/') {
                at_ = std::min(text_.find('\n', at_), text_.size());
            } else if (peek() == '/' && peek(1) == '*') {
                const std::size_t end = text_.find("*/", at_ + 2);
                if (end == std::string_view::npos) {
                    throw Broken{"a comment has no end"};
                }
                at_ = end + 2;
            } else {
                return;
            }
        }
    }

    Value value(int level) {
        if (level >= kMostPropertyListLevels) {
            throw Broken{"too many levels"};
        }
        skipBlank();
        switch (peek()) {
        case '{':
            return dictionary(level);
        case '(':
            return list(level);
        case '<':
            return data();
        default:
            return string();
        }
    }

    Value dictionary(int level) {
        ++at_;
        std::vector<Dictionary::Entry> entries;
        while (!takeAfterBlank('}')) {
            Value key = string();
            if (!takeAfterBlank('=')) {
                throw Broken{"a key without \"=\""};
            }
            entries.push_back({std::move(key), value(level + 1)});
            if (!takeAfterBlank(';')) {
                throw Broken{"an entry without \";\""};
            }
        }
        return Dictionary(std::move(entries));
    }

    Value list(int level) {
        ++at_;
        std::vector<Value> elements;
        while (!takeAfterBlank(')')) {
            elements.push_back(value(level + 1));
            if (!takeAfterBlank(',')) {
                if (!takeAfterBlank(')')) {
                    throw Broken{"a list without \")\""};
                }
                break;
            }
        }
        return List(std::move(elements));
    }

    Value data() {
        const std::size_t begin = at_++;
        while (hexDigit(peek()) >= 0 || (!atEnd() && isSpace(peek()))) {
            ++at_;
        }
        if (!take('>')) {
            throw Broken{"data that is not hexadecimal"};
        }
        return Value(text_.substr(begin, at_ - begin));
    }

    Value string() {
        const char quote = peek();
        if (quote == '"' || quote == '\'') {
            return quoted(quote);
        }
        const std::size_t begin = at_;
        while (!atEnd() && isPlain(peek()) &&
               !(peek() == '/' && (peek(1) == '/' || peek(1) == '*'))) {
            ++at_;
        }
        if (at_ == begin) {
            throw Broken{atEnd() ? "the text ends too early" : "a character that needs quotes"};
        }
        return Value(text_.substr(begin, at_ - begin));
    }

    Value quoted(char quote) {
        ++at_;
        std::string result;
        while (!take(quote)) {
            if (atEnd()) {
                throw Broken{"a quoted string has no end"};
            }
            const char c = text_[at_++];
            if (c == '\\') {
                escape(result);
            } else {
                result += c;
            }
        }
        return Value(result);
    }

    void escape(std::string& out) {
        if (peek() >= '0' && peek() <= '7') {
            appendUtf8(out, number(3, 8) & 0xFF);
            return;
        }
        if (atEnd()) {
            throw Broken{"a quoted string has no end"};
        }
        constexpr std::string_view kLetters = "abfnrtv";
        constexpr std::string_view kMeanings = "\a\b\f\n\r\t\v";
        const char c = text_[at_++];
        const std::size_t letter = kLetters.find(c);
        if (c == 'U' || c == 'u') {
            unicode(out);
        } else {
            out += letter != std::string_view::npos ? kMeanings[letter] : c;
        }
    }

    // UTF-16, as other writers of this format escape what is not ASCII.
    void unicode(std::string& out) {
        std::uint32_t code = number(4, 16);
        const bool high = code >= 0xD800 && code < 0xDC00;
        if (high && peek() == '\\' && (peek(1) == 'U' || peek(1) == 'u')) {
            const std::size_t before = at_;
            at_ += 2;
            const std::uint32_t low = number(4, 16);
            if (low >= 0xDC00 && low < 0xE000) {
                code = 0x10000 + ((code - 0xD800) << 10) + (low - 0xDC00);
            } else {
                at_ = before;
            }
        }
        const bool alone = code >= 0xD800 && code < 0xE000;
        appendUtf8(out, alone ? 0xFFFD : code);
    }

    std::uint32_t number(int mostDigits, int base) {
        std::uint32_t result = 0;
        int digits = 0;
        for (; digits < mostDigits; ++digits, ++at_) {
            const int digit = hexDigit(peek());
            if (digit < 0 || digit >= base) {
                break;
            }
            result = result * static_cast<std::uint32_t>(base) + static_cast<std::uint32_t>(digit);
        }
        if (digits == 0) {
            throw Broken{"an escape without digits"};
        }
        return result;
    }

    const std::string_view text_;
    std::size_t at_ = 0;
};

} // namespace

std::variant<Value, Error> parsePropertyListText(std::string_view text) {
    Reader reader(text);
    try {
        return reader.whole();
    } catch (const Broken& broken) {
        return Error{std::string(kPropertyListErrorDomain), 1,
                     fmt::format("line {}: {}", reader.line(), broken.what)};
    }
}

} // namespace halyard
