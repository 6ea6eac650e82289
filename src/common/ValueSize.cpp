#include "common/ValueSize.h"

namespace halyard {
namespace {

constexpr std::size_t kBlockBytes = 48; // a block's header and what malloc adds
constexpr std::size_t kMaxInlineText = 14;

std::size_t bytesOfEntries(std::span<const Dictionary::Entry> entries) {
    std::size_t sum = entries.empty() ? 0 : kBlockBytes;
    for (const auto& entry : entries) {
        sum += sizeof(entry) + entry.key.text().size() + bytesOf(entry.value);
    }
    return sum;
}

} // namespace

std::size_t bytesOf(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::String:
        return value.text().size() > kMaxInlineText ? kBlockBytes + value.text().size() : 0;
    case Value::Kind::List: {
        std::size_t sum = kBlockBytes;
        for (const Value& item : List::itemsOf(value)) {
            sum += sizeof(Value) + bytesOf(item);
        }
        return sum;
    }
    case Value::Kind::Dictionary:
        return bytesOfEntries(Dictionary::entriesOf(value));
    default:
        return 0;
    }
}

std::size_t bytesOf(const Dictionary& dictionary) {
    return bytesOfEntries({dictionary.begin(), dictionary.end()});
}

} // namespace halyard
