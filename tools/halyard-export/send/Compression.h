// gzip, as a request's body wears it.
//
// Bodies are whole when they are compressed, so nothing needs a stream. One object for many
// bodies: its tables and the memory of the last are used for the next. Not thread-safe.
#pragma once

#include <memory>
#include <string>
#include <string_view>

struct libdeflate_compressor;

namespace halyard::exporting {

class Gzip {
public:
    Gzip();

    // Valid until the next call; empty when there is no memory for it.
    std::string_view compressed(std::string_view bytes);

private:
    struct Free {
        void operator()(libdeflate_compressor* compressor) const;
    };

    std::unique_ptr<libdeflate_compressor, Free> compressor_;
    std::string out_;
};

} // namespace halyard::exporting
