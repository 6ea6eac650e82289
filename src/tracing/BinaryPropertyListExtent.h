// What a binary property list amounts to once it is read.
//
// Its objects refer to each other by number, and readers copy what is referred
// to: a few hundred bytes can stand for more values than any memory holds, or for
// a value that holds itself. So the extent is settled before anybody reads.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace halyard {

// For one measurement. Borrows the bytes. Format: "bplist00", the objects, a table
// of their offsets, and a trailer of 32 bytes that tells where the table is and
// how wide its entries and the references are; numbers are big-endian.
class BinaryPropertyListExtent {
public:
    BinaryPropertyListExtent(std::string_view bytes, int mostLevels, std::uint64_t mostBytes)
        : bytes_(bytes), mostLevels_(mostLevels), mostBytes_(mostBytes) {}

    // The bytes of all values, those that are referred to often counted as often.
    // None when the list is damaged, holds itself, has keys that are no text or
    // hold a zero, or more levels or bytes than allowed. Takes time in proportion to the file.
    [[nodiscard]] std::optional<std::uint64_t> measure();

private:
    struct Object {
        std::uint64_t bytes = 0;
        std::uint64_t content = 0; // where it begins: text, or references
        std::uint64_t references = 0;
        std::uint64_t keys = 0; // so many of the references come first
        unsigned unit = 0;      // bytes of a character; 0 when it is no text
    };
    struct Extent {
        std::uint64_t bytes = 0; // 0 while it is not known
        int levels = 0;
    };

    std::optional<std::uint64_t> number(std::uint64_t offset, std::size_t width) const;
    bool readTrailer();
    std::optional<Object> objectAt(std::uint64_t index) const;
    std::optional<Object> objectOfLength(std::uint64_t offset, unsigned marker) const;
    bool isKey(std::uint64_t index) const;
    std::optional<Extent> extentOf(std::uint64_t index, int level);
    std::optional<Extent> sumOf(const Object& object, int level);

    const std::string_view bytes_;
    const int mostLevels_;
    const std::uint64_t mostBytes_;
    std::size_t offsetWidth_ = 0;
    std::size_t referenceWidth_ = 0;
    std::uint64_t root_ = 0;
    std::uint64_t table_ = 0;
    std::vector<Extent> known_; // by object
};

} // namespace halyard
