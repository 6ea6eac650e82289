#include "report/RowChunks.h"

#include <cstdlib>
#include <stdexcept>
#include <utility>

#include <zlib.h>

namespace halyard::ctl {
namespace {

// Most of what level 9 saves, at a third of its cost.
constexpr int kLevel = 5;

} // namespace

RowChunks::RowChunks(const Limits& limits) : limits_(limits) {}

RowChunks::~RowChunks() {
    if (stream_ != nullptr) {
        (void)std::fclose(stream_);
    }
    std::free(text_);
}

void RowChunks::add(const std::function<void(JsonStream&)>& write) {
    if (stream_ == nullptr) {
        stream_ = ::open_memstream(&text_, &size_);
        if (stream_ == nullptr) {
            throw std::bad_alloc();
        }
    }
    JsonStream json(stream_);
    json.beginDocument();
    write(json);
    json.endDocument();
    (void)std::fflush(stream_);
    ++rows_;
    ++taken_;
    if (size_ >= limits_.chunk) {
        pack();
    }
}

void RowChunks::finish() {
    if (rows_ > 0) {
        pack();
    }
}

void RowChunks::pack() {
    Chunk chunk;
    chunk.rows = std::exchange(rows_, 0);
    chunk.plain = size_;
    uLongf length = ::compressBound(size_);
    chunk.packed.resize(length);
    (void)::compress2(reinterpret_cast<Bytef*>(chunk.packed.data()), &length,
                      reinterpret_cast<const Bytef*>(text_), size_, kLevel);
    chunk.packed.resize(length);
    chunk.packed.shrink_to_fit();
    (void)std::fclose(std::exchange(stream_, nullptr));
    std::free(std::exchange(text_, nullptr));

    kept_ += chunk.rows;
    packedBytes_ += chunk.packed.size();
    plainBytes_ += chunk.plain;
    chunks_.push_back(std::move(chunk));
    while (chunks_.size() > 1 && (packedBytes_ > limits_.packed || plainBytes_ > limits_.plain)) {
        dropOldest();
    }
}

void RowChunks::dropOldest() {
    const Chunk& oldest = chunks_.front();
    kept_ -= oldest.rows;
    packedBytes_ -= oldest.packed.size();
    plainBytes_ -= oldest.plain;
    chunks_.pop_front();
}

std::string RowChunks::unpacked(const Chunk& chunk) {
    std::string text(chunk.plain, '\0');
    uLongf length = text.size();
    (void)::uncompress(reinterpret_cast<Bytef*>(text.data()), &length,
                       reinterpret_cast<const Bytef*>(chunk.packed.data()), chunk.packed.size());
    return text;
}

} // namespace halyard::ctl
