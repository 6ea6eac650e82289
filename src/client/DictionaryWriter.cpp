#include "client/DictionaryWriter.h"

#include <algorithm>

#include "protocol/Wire.h"

namespace halyard::client {
namespace {

constexpr std::size_t kDefaultCapacity = 2048;
// The heads of containers whose count is not known yet: of fixed width.
constexpr char kWideArray = '\xDD';
constexpr char kWideMap = '\xDF';
constexpr std::size_t kWideCount = 4;

} // namespace

DictionaryWriter::DictionaryWriter(std::size_t capacity) {
    bytes_.reserve(capacity != 0 ? std::min(capacity, protocol::kMaxFrameBytes) : kDefaultCapacity);
}

void DictionaryWriter::clear() noexcept {
    bytes_.clear();
    open_[0] = {};
    depth_ = 0;
    elements_ = 0;
    stamps_ = kNoStamps;
    error_ = HALYARD_OK;
}

halyard_result DictionaryWriter::fail(halyard_result error) noexcept {
    if (error_ == HALYARD_OK) {
        error_ = error;
    }
    return error_;
}

halyard_result DictionaryWriter::error() const noexcept {
    return error_ == HALYARD_OK && depth_ != 0 ? HALYARD_INVALID : error_;
}

void DictionaryWriter::appendKey(const char* key) {
    const std::string_view text(key);
    if (depth_ == 0) {
        stamps_ = static_cast<StampSet>(stamps_ | stampNamed(text));
    }
    protocol::appendText(bytes_, text);
    ++elements_;
}

// Everything that goes in goes through here: the key where one is needed, then
// what `append` writes, which counts as one element.
template <class Append>
halyard_result DictionaryWriter::add(const char* key, Append append) noexcept {
    Container& container = open_[depth_];
    if (error_ != HALYARD_OK) {
        return error_;
    }
    if (key == nullptr && !container.isList) {
        return fail(HALYARD_INVALID);
    }
    try {
        if (!container.isList) {
            appendKey(key);
        }
        append();
    } catch (...) {
        return fail(HALYARD_NO_MEMORY);
    }
    ++container.count;
    ++elements_;
    const bool fits =
        bytes_.size() <= protocol::kMaxFrameBytes && elements_ <= protocol::kMaxElements;
    return fits ? HALYARD_OK : fail(HALYARD_TOO_LARGE);
}

halyard_result DictionaryWriter::setText(const char* key, std::string_view text) noexcept {
    // Refused before it is copied: nobody grows the buffer beyond a frame.
    if (text.size() > protocol::kMaxFrameBytes) {
        return fail(HALYARD_TOO_LARGE);
    }
    return add(key, [&] { protocol::appendText(bytes_, text); });
}

halyard_result DictionaryWriter::setNumber(const char* key, const Value& value) noexcept {
    return add(key, [&] { protocol::appendValue(bytes_, value); });
}

halyard_result DictionaryWriter::beginContainer(const char* key, bool isList) noexcept {
    if (depth_ + 1 == kMaxOpen) {
        return fail(HALYARD_INVALID);
    }
    std::size_t start = 0;
    const halyard_result result = add(key, [&] {
        start = bytes_.size();
        bytes_ += isList ? kWideArray : kWideMap;
        bytes_.append(kWideCount, '\0');
    });
    if (result == HALYARD_OK) {
        open_[++depth_] = {.count = 0, .start = start, .isList = isList};
    }
    return result;
}

void DictionaryWriter::setCount(const Container& container) noexcept {
    for (std::size_t i = 0; i < kWideCount; ++i) {
        bytes_[container.start + 1 + i] = static_cast<char>(container.count >> (24 - 8 * i));
    }
}

halyard_result DictionaryWriter::endContainer() noexcept {
    if (depth_ == 0) {
        return fail(HALYARD_INVALID);
    }
    if (error_ == HALYARD_OK) {
        setCount(open_[depth_]);
        --depth_;
    }
    return error_;
}

} // namespace halyard::client
