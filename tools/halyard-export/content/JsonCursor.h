// Goes over the text of a JSON object that has no spaces, such as the daemon writes.
//
// It knows only what is plain: whatever it does not take is left to a parser, which may well
// take it. A value; any thread.
#pragma once

#include <cstddef>
#include <string_view>

namespace halyard::exporting {

class JsonCursor {
public:
    // Borrows `text`.
    explicit JsonCursor(std::string_view text) : text_(text) {}

    std::size_t at() const { return at_; }
    bool isAtEnd() const { return at_ == text_.size(); }
    std::string_view since(std::size_t start) const { return text_.substr(start, at_ - start); }
    std::string_view rest() const { return text_.substr(at_); }
    void skip(std::size_t bytes) { at_ += bytes; }

    bool take(char c) {
        const bool isThere = at_ < text_.size() && text_[at_] == c;
        at_ += isThere ? 1 : 0;
        return isThere;
    }
    bool take(std::string_view part) {
        const bool isThere = text_.substr(at_, part.size()) == part;
        at_ += isThere ? part.size() : 0;
        return isThere;
    }
    // Requires that `value` is a whole one. False where a longer one begins with it.
    bool takeValue(std::string_view value);
    // Empty for all else: a text without escapes, with its quotes, and for a key the colon.
    std::string_view takeText();
    std::string_view takeKey();
    // Without an exponent, which parsers have bounds of their own for.
    std::string_view takeNumber();

private:
    bool takeDigits();

    std::string_view text_;
    std::size_t at_ = 0;
};

} // namespace halyard::exporting
