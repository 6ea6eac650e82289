// Any bytes may stand where an audio issue is expected: they are taken or
// refused, and what was taken survives being written and read again.

#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "sinks/AudioIssueDetected.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    tmxmetrics::WireReader reader(bytes);
    tmxmetrics::AudioIssueDetected issue;
    if (!issue.readFrom(reader)) {
        return 0;
    }
    std::string text;
    issue.formatText(text, "issue");

    const std::string written = issue.encoded();
    tmxmetrics::WireReader again(written);
    tmxmetrics::AudioIssueDetected copy;
    if (!copy.readFrom(again) || !(copy == issue)) {
        std::abort();
    }
    return 0;
}
