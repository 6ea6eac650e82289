#include "LookOnce.h"

#include "OnceReport.h"
#include "PipeWireAdapter.h"

namespace halyard::pipewire {

namespace {

// Cycles are told about once a second, and perhaps just after we would have left.
constexpr std::chrono::milliseconds kPatience{500};

} // namespace

Look lookOnce(const std::string& remote, std::chrono::milliseconds duration) {
    using Clock = std::chrono::steady_clock;
    OnceReport report;
    std::string lastNote;
    PipeWireAdapter graph({.remote = remote,
                           .cycle = [&](const Cycle& cycle) { report.take(cycle); },
                           .note = [&](const std::string& text) { lastNote = text; }},
                          [&](const GraphEvent& event) { report.handle(event); });
    const Clock::time_point end = Clock::now() + duration;
    const Clock::time_point last = end + kPatience;
    for (auto now = Clock::now(); now < end || (now < last && !report.complete());
         now = Clock::now()) {
        graph.iterate(std::chrono::ceil<std::chrono::milliseconds>((now < end ? end : last) - now));
    }
    if (!graph.connected()) {
        return {false, "no PipeWire answers (" + lastNote + ")"};
    }
    return {true, report.text()};
}

} // namespace halyard::pipewire
