#include "LookOnce.h"

#include "OnceReport.h"
#include "PipeWireAdapter.h"

namespace halyard::pipewire {

Look lookOnce(const std::string& remote, std::chrono::milliseconds duration) {
    using Clock = std::chrono::steady_clock;
    OnceReport report;
    std::string lastNote;
    PipeWireAdapter graph(
        {.remote = remote, .note = [&](const std::string& text) { lastNote = text; }},
        [&](const GraphEvent& event) { report.handle(event); });
    const Clock::time_point end = Clock::now() + duration;
    for (auto left = duration; left.count() > 0;
         left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now())) {
        graph.iterate(left);
    }
    if (!graph.connected()) {
        return {false, "no PipeWire answers (" + lastNote + ")"};
    }
    return {true, report.text()};
}

} // namespace halyard::pipewire
