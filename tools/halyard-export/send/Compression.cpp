#include "send/Compression.h"

#include <zlib.h>

namespace halyard::exporting {
namespace {

constexpr int kGzip = 16; // added to the bits of the window
constexpr int kMemoryLevel = 8;

} // namespace

std::string gzipped(std::string_view bytes) {
    z_stream stream{};
    if (deflateInit2(&stream, Z_BEST_SPEED, Z_DEFLATED, MAX_WBITS + kGzip, kMemoryLevel,
                     Z_DEFAULT_STRATEGY) != Z_OK) {
        return {};
    }
    std::string out(deflateBound(&stream, bytes.size()), '\0');
    // zlib's type for what it only reads.
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
    stream.avail_in = static_cast<uInt>(bytes.size());
    stream.next_out = reinterpret_cast<Bytef*>(out.data());
    stream.avail_out = static_cast<uInt>(out.size());
    const bool isWhole = deflate(&stream, Z_FINISH) == Z_STREAM_END;
    out.resize(isWhole ? stream.total_out : 0);
    deflateEnd(&stream);
    return out;
}

} // namespace halyard::exporting
