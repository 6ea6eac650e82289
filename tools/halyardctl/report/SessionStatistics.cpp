#include "report/SessionStatistics.h"

#include <optional>

#include "common/HYReportingUtility.h"

namespace halyard::ctl {
namespace {

std::optional<StatisticName> nameOf(std::string_view key, std::string_view kind) {
    auto name = reading::statisticName(key, kind);
    if (name) {
        name->driver = shortName(name->driver);
        name->group = shortName(name->group);
        name->channel = shortName(name->channel);
    }
    return name;
}

std::string_view textOf(const rapidjson::Value& value) {
    return value.IsString() ? std::string_view(value.GetString(), value.GetStringLength())
                            : std::string_view();
}

} // namespace

void SessionStatistics::take(std::int64_t session, std::int64_t category, std::int64_t type,
                             std::string_view payload) {
    if (category != kAudioEventCategoryHWReporting) {
        return;
    }
    rapidjson::Document document;
    document.Parse<rapidjson::kParseIterativeFlag>(payload.data(), payload.size());
    if (document.HasParseError() || !document.IsObject()) {
        return;
    }
    for (const auto& entry : document.GetObject()) {
        takeEntry(session, type, textOf(entry.name), entry.value);
    }
}

void SessionStatistics::takeEntry(std::int64_t session, std::int64_t type, std::string_view key,
                                  const rapidjson::Value& value) {
    if (type == kAudioEventTypeSimple && value.IsInt64()) {
        if (auto name = nameOf(key, "Simple")) {
            digest_.counters.add({session, *std::move(name), value.GetInt64()});
        }
    } else if (type == kAudioEventTypeHistogram) {
        auto name = nameOf(key, "Histogram");
        auto histogram = reading::histogramIn(textOf(value));
        if (name && histogram) {
            histogram->unit = shortName(histogram->unit);
            digest_.histograms.add({session, *std::move(name), *std::move(histogram)});
        }
    } else if (type == kAudioEventTypeState) {
        auto name = nameOf(key, "State");
        auto states = reading::statesIn(textOf(value));
        if (name && !states.empty()) {
            for (StateText& state : states) {
                state.name = shortName(state.name);
            }
            digest_.residencies.add({session, *std::move(name), std::move(states)});
        }
    }
}

} // namespace halyard::ctl
