// The entries of an issue, as MessagePack, in a buffer that is part of the object.
//
// Why not through a dictionary: an issue is told by the thread that missed its
// cycle, which has no dictionary at hand that nobody else is using, and must not
// make one. A few KiB of its stack will do.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "halyard/halyard.h"

namespace halyard::client {

class IssueEntries {
public:
    // Of one text. Beyond it, one byte more is read.
    static constexpr std::size_t kMaxText = 1024;

    // HALYARD_OK, or why this issue is not to be sent. Once.
    [[nodiscard]] halyard_result fill(const halyard_issue& issue) noexcept;

    // A few entries without a map's header.
    std::string_view bytes() const noexcept { return {buffer_.data(), size_}; }
    std::uint32_t count() const noexcept { return count_; }

private:
    // A null text adds nothing.
    halyard_result addText(std::string_view key, const char* text) noexcept;
    void addReal(std::string_view key, double value) noexcept;
    void addKey(std::string_view key) noexcept;
    void append(std::string_view bytes) noexcept;
    void appendNumber(std::uint64_t bits, int bytes) noexcept;

    static constexpr std::size_t kTexts = 3;
    // What the keys, the heads of the texts and the number take.
    static constexpr std::size_t kMaxRest = 128;

    std::array<char, kTexts * kMaxText + kMaxRest> buffer_;
    std::size_t size_ = 0;
    std::uint32_t count_ = 0;
};

} // namespace halyard::client
