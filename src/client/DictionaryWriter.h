// Writes a message or configuration as MessagePack while it is being built.
//
// Why not as a Value: building one allocates for every longer string, and frees
// on another thread what the caller's allocated; here the bytes that go over the
// wire grow in one buffer, which is kept from message to message.
//
// Broken by a mistake (see error()), it stays so until clear(). One thread at a
// time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "client/TimeStamps.h"
#include "common/Value.h"
#include "halyard/halyard.h"

namespace halyard::client {

class DictionaryWriter {
public:
    // Throws std::bad_alloc.
    explicit DictionaryWriter(std::size_t capacity);

    void clear() noexcept;
    // `key` is null or ignored in a list.
    halyard_result setText(const char* key, std::string_view text) noexcept;
    halyard_result setNumber(const char* key, const Value& value) noexcept;
    halyard_result beginContainer(const char* key, bool isList) noexcept;
    halyard_result endContainer() noexcept;

    // Marks it as broken; the first mark stays. Answers that one.
    halyard_result fail(halyard_result error) noexcept;

    // HALYARD_OK when it is complete and well formed.
    halyard_result error() const noexcept;
    // The entries, without the map's header.
    std::string_view body() const noexcept { return bytes_; }
    std::uint32_t entryCount() const noexcept { return open_[0].count; }
    // Keys and values on all levels.
    std::uint32_t elementCount() const noexcept { return elements_; }
    StampSet stamps() const noexcept { return stamps_; }

private:
    // The frame, its arguments and the dictionary itself take three levels.
    static constexpr int kMaxOpen = 30;
    struct Container {
        std::uint32_t count = 0;
        std::size_t start = 0; // where its header stands
        bool isList = false;
    };

    template <class Append> halyard_result add(const char* key, Append append) noexcept;
    void appendKey(const char* key);
    void setCount(const Container& container) noexcept;

    std::string bytes_;
    Container open_[kMaxOpen]; // [0] is the dictionary itself
    int depth_ = 0;
    std::uint32_t elements_ = 0;
    StampSet stamps_ = kNoStamps;
    halyard_result error_ = HALYARD_OK;
};

} // namespace halyard::client
