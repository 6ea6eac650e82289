// Reads protocol-buffers wire format out of bytes that nobody vouches for.
//
// Varints come from protozero; the walk over keys is our own because messages of
// old writers may hold groups, which protozero refuses, and because the bytes
// must never make us throw or assert. The first error sticks: everything reads
// as zero or empty from then on.
//
// Not thread-safe. Borrows the bytes.
#pragma once

#include <cstdint>
#include <string_view>

namespace tmxmetrics {

class WireReader {
public:
    enum WireType : std::uint8_t {
        kVarint = 0,
        kFixed64 = 1,
        kBytes = 2,
        kBeginGroup = 3,
        kEndGroup = 4,
        kFixed32 = 5,
    };
    struct Key {
        std::uint32_t field = 0;
        std::uint8_t wireType = 0; // 0 to 7
    };
    // Groups inside a skipped group.
    static constexpr std::size_t kMaxGroupDepth = 100;

    explicit WireReader(std::string_view bytes) : rest_(bytes) {}

    bool atEnd() const { return rest_.empty(); }
    bool failed() const { return failed_; }

    Key readKey();
    std::uint64_t readVarint();
    std::string_view readBytes();
    // Passes over the value that belongs to `key`.
    void skip(Key key);

private:
    void skipScalar(std::uint8_t wireType);
    void skipGroup(std::uint32_t field);
    std::string_view take(std::uint64_t length);
    void fail();

    std::string_view rest_;
    bool failed_ = false;
};

} // namespace tmxmetrics
