#include "send/Compression.h"

#include <libdeflate.h>

namespace halyard::exporting {
namespace {

// Higher ones take much longer for a few bytes (docs/export.md has the figures).
constexpr int kLevel = 6;

} // namespace

void Gzip::Free::operator()(libdeflate_compressor* compressor) const {
    libdeflate_free_compressor(compressor);
}

Gzip::Gzip() : compressor_(libdeflate_alloc_compressor(kLevel)) {}

std::string_view Gzip::compressed(std::string_view bytes) {
    if (compressor_ == nullptr) {
        return {};
    }
    const std::size_t bound = libdeflate_gzip_compress_bound(compressor_.get(), bytes.size());
    if (out_.size() < bound) {
        out_.resize(bound);
    }
    return {out_.data(), libdeflate_gzip_compress(compressor_.get(), bytes.data(), bytes.size(),
                                                  out_.data(), out_.size())};
}

} // namespace halyard::exporting
