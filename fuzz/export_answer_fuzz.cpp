// Whatever a receiver answers with, it rejects a number of records and may say why.

#include <cstdint>
#include <string_view>

#include "Require.h"
#include "send/Answer.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace halyard;
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    const exporting::PartialSuccess partial = exporting::partialSuccessIn(bytes);
    // A count that is negative rejects nothing.
    fuzz::require(partial.rejected <= INT64_MAX);
    fuzz::require(partial.message.size() <= size);
    return 0;
}
