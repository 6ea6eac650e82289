#include "content/JsonCursor.h"

#include <utility>

namespace halyard::exporting {
namespace {

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

} // namespace

bool JsonCursor::takeValue(std::string_view value) {
    const std::size_t start = at_;
    if (take(value) && !isAtEnd() && (text_[at_] == ',' || text_[at_] == '}')) {
        return true;
    }
    at_ = start;
    return false;
}

std::string_view JsonCursor::takeText() {
    constexpr unsigned char kFirstPlain = 0x20;
    if (at_ == text_.size() || text_[at_] != '"') {
        return {};
    }
    for (std::size_t end = at_ + 1; end < text_.size(); ++end) {
        const char c = text_[end];
        if (c == '"') {
            const std::size_t start = std::exchange(at_, end + 1);
            return since(start);
        }
        if (c == '\\' || static_cast<unsigned char>(c) < kFirstPlain) {
            break;
        }
    }
    return {};
}

std::string_view JsonCursor::takeKey() {
    const std::size_t start = at_;
    if (!takeText().empty() && take(':')) {
        return since(start);
    }
    at_ = start;
    return {};
}

bool JsonCursor::takeDigits() {
    const std::size_t start = at_;
    while (at_ < text_.size() && isDigit(text_[at_])) {
        ++at_;
    }
    return at_ > start;
}

std::string_view JsonCursor::takeNumber() {
    const std::size_t start = at_;
    take('-');
    bool isNumber = take('0') || takeDigits();
    if (isNumber && take('.')) {
        isNumber = takeDigits();
    }
    if (isNumber && !take('e') && !take('E')) {
        return since(start);
    }
    at_ = start;
    return {};
}

} // namespace halyard::exporting
