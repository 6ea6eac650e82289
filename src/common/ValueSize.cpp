#include "common/ValueSize.h"

namespace halyard {
namespace {

constexpr std::size_t kBlockBytes = 48; // a block's header and what malloc adds
constexpr std::size_t kMaxInlineText = 14;
// How DictionaryBlock::measured says of how many entries it is.
constexpr unsigned kCountShift = 48;
constexpr std::size_t kMostCounted = 0xFFFF;

std::size_t bytesOfEntries(std::span<const Dictionary::Entry> entries) {
    std::size_t sum = 0;
    for (const auto& entry : entries) {
        sum += sizeof(entry) + entry.key.text().size() + bytesOf(entry.value);
    }
    return sum;
}

// A message is asked for its size several times on its way, once with its tag.
std::size_t bytesOfDictionary(detail::DictionaryBlock* block,
                              std::span<const Dictionary::Entry> entries) {
    if (entries.empty()) {
        return 0;
    }
    const std::uint64_t known = block->measured.load(std::memory_order_relaxed);
    const std::size_t count = known >> kCountShift;
    const std::size_t bytes = known & ((std::uint64_t{1} << kCountShift) - 1);
    if (count == entries.size()) {
        return bytes;
    }
    if (count > entries.size()) {
        return bytes - bytesOfEntries({entries.data() + entries.size(), count - entries.size()});
    }
    const std::size_t sum =
        (count == 0 ? kBlockBytes : bytes) + bytesOfEntries(entries.subspan(count));
    if (entries.size() <= kMostCounted) {
        block->measured.store(std::uint64_t{entries.size()} << kCountShift | sum,
                              std::memory_order_relaxed);
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
        return bytesOfDictionary(detail::BlockOf::dictionary(value), Dictionary::entriesOf(value));
    default:
        return 0;
    }
}

std::size_t bytesOf(const Dictionary& dictionary) {
    return bytesOfDictionary(detail::BlockOf::dictionary(dictionary),
                             {dictionary.begin(), dictionary.end()});
}

} // namespace halyard
