// Rows of a table for the page, packed: a hundred thousand messages take a tenth of
// what their texts do, and the page unpacks them only when somebody looks.
//
// Rows are taken from the oldest to the newest. Beyond its limits the oldest go, a chunk
// at a time, so that a page stays one that a browser opens, whatever the store holds.
//
// Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <functional>
#include <string>

#include "output/JsonStream.h"

namespace halyard::ctl {

class RowChunks {
public:
    struct Limits {
        std::size_t packed = std::size_t{3} * 1024 * 1024;
        std::size_t plain = std::size_t{96} * 1024 * 1024; // what the browser will have to hold
        std::size_t chunk = std::size_t{256} * 1024;       // plain bytes that make one
    };
    struct Chunk {
        std::string packed; // zlib's form; inside a JSON value a line
        std::uint64_t rows = 0;
        std::size_t plain = 0;
    };

    explicit RowChunks(const Limits& limits);
    ~RowChunks();
    RowChunks(const RowChunks&) = delete;
    RowChunks& operator=(const RowChunks&) = delete;

    // `write` writes one JSON value.
    void add(const std::function<void(JsonStream&)>& write);
    // Packs what is left. Once, after the last.
    void finish();

    std::uint64_t taken() const { return taken_; }
    std::uint64_t kept() const { return kept_; }
    const std::deque<Chunk>& chunks() const { return chunks_; }
    static std::string unpacked(const Chunk& chunk);

private:
    void pack();
    void dropOldest();

    const Limits limits_;
    std::deque<Chunk> chunks_;
    std::uint64_t taken_ = 0;
    std::uint64_t kept_ = 0;
    std::size_t packedBytes_ = 0;
    std::size_t plainBytes_ = 0;
    // The chunk that is being filled.
    char* text_ = nullptr;
    std::size_t size_ = 0;
    std::FILE* stream_ = nullptr;
    std::uint64_t rows_ = 0;
};

} // namespace halyard::ctl
