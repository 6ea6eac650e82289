// Trace parameter files are named by clients, in any form of a property list:
// nothing in one may do more than be complained about.

#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "Require.h"
#include "testing/TestPlatform.h"
#include "tracing/TraceParamsParser.h"

using halyard::TraceDataParams;
using halyard::fuzz::require;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static halyard::testing::TestPlatform platform;
    platform.log.clear();
    platform.files.files["/fuzz.plist"] = {reinterpret_cast<const char*>(data), size};
    const auto params = halyard::TraceParamsParser("/fuzz.plist").loadTraceParams();
    require(params.isSignpost == 0 || params.isSignpost == 1);
    for (const TraceDataParams& item : params.items) {
        require(item.type != TraceDataParams::Impulse || item.endCode == item.beginCode);
        require(item.type != TraceDataParams::Level || item.endCode == 0);
    }
    return 0;
}
