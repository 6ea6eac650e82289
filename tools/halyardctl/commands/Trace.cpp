// What a trace measured.
#include "commands/Commands.h"
#include "commands/Listing.h"
#include "reading/TraceResults.h"

#include <fmt/format.h>

namespace halyard::ctl {
namespace {

using Align = Table::Column::Align;
using reading::TraceDurations;

void write(JsonStream& json, const TraceDurations& of) {
    json.beginElement();
    json.beginObject();
    json.field("name", std::string_view(of.name));
    json.countField("count", of.count);
    const bool any = of.count > 0;
    const auto field = [&](std::string_view name, double value) {
        json.field(name, any ? std::optional(value) : std::nullopt);
    };
    field("min", of.min);
    field("median", of.median);
    field("p90", of.p90);
    field("p99", of.p99);
    field("max", of.max);
    field("total", of.total);
    json.endObject();
}

// "1.25 ms"
std::string lengthOf(double nanoseconds) {
    if (nanoseconds < 1e3) {
        return fmt::format("{:.0f} ns", nanoseconds);
    }
    if (nanoseconds < 1e6) {
        return fmt::format("{:.2f} µs", nanoseconds / 1e3);
    }
    return nanoseconds < 1e9 ? fmt::format("{:.2f} ms", nanoseconds / 1e6)
                             : fmt::format("{:.2f} s", nanoseconds / 1e9);
}

std::vector<Cell> cellsOf(const TraceDurations& of) {
    std::vector<Cell> cells = {of.name, std::to_string(of.count)};
    for (const double value : {of.min, of.median, of.p90, of.p99, of.max, of.total}) {
        cells.emplace_back(of.count > 0 ? lengthOf(value) : "");
    }
    return cells;
}

} // namespace

Exit runTrace(Context& context, const std::string& file) {
    const auto forEach =
        [&file](Context&, const std::function<bool(const TraceDurations&)>& take) -> Outcome<void> {
        const auto results = reading::readTraceResults(file);
        if (!results.ok()) {
            return results.failure();
        }
        for (const TraceDurations& one : results.value()) {
            if (!take(one)) {
                break;
            }
        }
        return {};
    };
    if (context.json) {
        return listAsJson<TraceDurations>(context, forEach, write);
    }
    const std::vector<Table::Column> columns = {
        {"NAME", Align::Left, true},     {"COUNT", Align::Right},
        {"MIN", Align::Right, false, 2}, {"MEDIAN", Align::Right},
        {"P90", Align::Right, false, 1}, {"P99", Align::Right},
        {"MAX", Align::Right, false, 4}, {"TOTAL", Align::Right, false, 3}};
    return listAsTable<TraceDurations>(context, forEach, columns, cellsOf, "Nothing was measured.");
}

} // namespace halyard::ctl
