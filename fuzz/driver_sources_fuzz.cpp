// Statistics files are written by drivers and by operators' scripts: whatever
// stands in them, a reader takes it or leaves it.

#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "Require.h"
#include "linux/drivers/CycleChannels.h"
#include "linux/drivers/SourceKinds.h"
#include "linux/drivers/SourceText.h"

using halyard::fuzz::require;
using namespace halyard::linux_;

namespace {

void checkStates(const std::optional<SourceStates>& states) {
    require(!states || (!states->empty() && states->size() <= kMaxSourceStates));
    if (states) {
        for (const SourceState& state : *states) {
            require(!state.name.empty() && state.name.find('\n') == std::string::npos);
        }
    }
}

void checkBuckets(const std::optional<SourceBuckets>& buckets) {
    require(!buckets || buckets->size() <= kMaxSourceBuckets);
}

// Nothing is opened by making a source, but for the interrupts, which are looked
// for where there are none.
void checkSource(std::string_view text) {
    SourceRoot root{"/nonexistent"};
    const auto made = makeChannelSource(text, root);
    require(made.ok() || !made.failure().text.empty());
    require(!made.ok() || findSourceKind(text) != nullptr);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    (void)parseInteger(text);
    (void)parsePressure(text, "some");
    (void)parsePerCpuCount(text);
    for (const char* row : {"1", "2", "HI", "cpu"}) {
        for (const std::size_t column : {1U, 2U, 9U}) {
            (void)parseField(text, {row, column});
        }
    }
    checkStates(parseTimeInState(text));
    checkStates(parseTransitionTable(text));
    checkStates(parseTransitionStatistics(text));
    checkBuckets(parseBuckets(text));
    checkBuckets(parseTraceHistogram(text));
    const auto status = parsePcmStatus(text);
    require(!status || !status->state.empty());
    const auto device = cycleDeviceName(text);
    require(!device || (!device->empty() && device->size() <= text.size()));
    checkSource(text);
    return 0;
}
