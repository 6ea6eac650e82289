#include "linux/drivers/SourceKinds.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <iterator>
#include <optional>

#include "linux/drivers/ChannelSources.h"
#include "linux/drivers/SourceText.h"

namespace halyard::linux_ {
namespace {

using Made = Result<std::unique_ptr<ChannelSource>>;

constexpr std::size_t kMostColumn = 10000;

// One try at making a source out of what follows the kind.
struct Order {
    std::string_view rest;
    SourceRoot& root;

    SampledFile file(std::string_view path) const { return {root.resolve(path), root.descriptors}; }
    SampledFile file() const { return file(rest); }
    // Splits the part behind the last ":" off.
    std::optional<std::string_view> takeLast() {
        const std::size_t colon = rest.rfind(':');
        if (colon == std::string_view::npos || colon + 1 == rest.size()) {
            return std::nullopt;
        }
        const std::string_view last = rest.substr(colon + 1);
        rest = rest.substr(0, colon);
        return last;
    }
};

Failure mistake(std::string text) {
    return {{}, std::move(text)};
}

template <class Source, class... Arguments> Made make(Arguments&&... arguments) {
    return std::make_unique<Source>(std::forward<Arguments>(arguments)...);
}

Made makeFile(Order order) {
    return make<CounterSource>(order.file(), parseInteger);
}

// Paths of devices hold colons, so the row and the column are found from the end.
Made makeField(Order order) {
    const auto column = order.takeLast();
    const auto row = order.takeLast();
    FieldPlace place;
    if (!column || !row) {
        return mistake("needs the form field:PATH:ROW:COLUMN");
    }
    const char* const end = column->data() + column->size();
    if (std::from_chars(column->data(), end, place.column).ptr != end || place.column < 1 ||
        place.column > kMostColumn) {
        return mistake(fmt::format("COLUMN must be a number from 1 to {}", kMostColumn));
    }
    place.row = *row;
    return make<CounterSource>(order.file(),
                               [place](std::string_view text) { return parseField(text, place); });
}

Made makePressure(Order order) {
    const auto line = order.takeLast();
    if (line != "some" && line != "full") {
        return mistake("needs the form pressure:PATH:some or pressure:PATH:full");
    }
    return make<CounterSource>(order.file(), [word = std::string(*line)](std::string_view text) {
        return parsePressure(text, word);
    });
}

Made makeInterrupt(Order order) {
    return make<InterruptSource>(std::string(order.rest), order.root);
}

Made makeCpuIdle(Order order) {
    return make<CpuIdleSource>(order.root.resolve(order.rest), order.root);
}

Made makeRuntimePower(Order order) {
    return make<RuntimePowerSource>(order.root.resolve(order.rest), order.root);
}

Made makeCpuFrequency(Order order) {
    const std::string directory(order.rest);
    auto source = std::make_unique<StateTableSource>(order.file(directory + "/time_in_state"),
                                                     parseTimeInState);
    source->setTransitions(order.file(directory + "/trans_table"));
    return source;
}

Made makeDeviceFrequency(Order order) {
    return make<StateTableSource>(order.file(std::string(order.rest) + "/trans_stat"),
                                  parseTransitionStatistics);
}

template <PcmSource::What what> Made makePcm(Order order) {
    return make<PcmSource>(order.file(std::string(order.rest) + "/status"), what);
}

Made makeHistogram(Order order) {
    return make<BucketSource>(order.file(), parseBuckets);
}

Made makeTraceHistogram(Order order) {
    return make<BucketSource>(order.file(), parseTraceHistogram);
}

struct Kind : SourceKind {
    Made (*make)(Order order);
    bool takesPath = true;
};

constexpr std::uint64_t kNoTime = 1;
constexpr std::uint64_t kMilliseconds = 1'000;
constexpr std::uint64_t kMicroseconds = 1'000'000;

constexpr Kind kKinds[] = {
    {{"file", ChannelFormat::Simple, kNoTime}, makeFile},
    {{"field", ChannelFormat::Simple, kNoTime}, makeField},
    {{"pressure", ChannelFormat::Simple, kNoTime}, makePressure},
    {{"irq", ChannelFormat::Simple, kNoTime}, makeInterrupt, false},
    {{"cpuidle", ChannelFormat::State, kMicroseconds}, makeCpuIdle},
    {{"runtime_pm", ChannelFormat::State, kMilliseconds}, makeRuntimePower},
    {{"cpufreq", ChannelFormat::State, kMilliseconds}, makeCpuFrequency},
    {{"devfreq", ChannelFormat::State, kMilliseconds}, makeDeviceFrequency},
    {{"alsa_frames", ChannelFormat::Simple, kNoTime}, makePcm<PcmSource::What::Frames>},
    {{"alsa_xruns", ChannelFormat::Simple, kNoTime}, makePcm<PcmSource::What::Xruns>},
    {{"alsa_restarts", ChannelFormat::Simple, kNoTime}, makePcm<PcmSource::What::Restarts>},
    {{"alsa_states", ChannelFormat::State, kMicroseconds}, makePcm<PcmSource::What::States>},
    {{"histogram", ChannelFormat::Histogram, kNoTime}, makeHistogram},
    {{"tracefs_hist", ChannelFormat::Histogram, kNoTime}, makeTraceHistogram}};

// What stands before the ":".
std::string_view kindName(std::string_view source) {
    return source.substr(0, source.find(':'));
}

const Kind* findKind(std::string_view source) {
    const auto* const at =
        std::find_if(std::begin(kKinds), std::end(kKinds),
                     [&](const Kind& kind) { return kind.name == kindName(source); });
    return at != std::end(kKinds) ? at : nullptr;
}

} // namespace

const SourceKind* findSourceKind(std::string_view source) {
    return findKind(source);
}

Made makeChannelSource(std::string_view source, SourceRoot& root) {
    const Kind* const kind = findKind(source);
    if (kind == nullptr) {
        return mistake(fmt::format("\"{}\" is no kind of source", kindName(source)));
    }
    std::string_view rest = source.substr(kind->name.size());
    rest.remove_prefix(rest.empty() ? 0 : 1);
    if (kind->takesPath && !rest.starts_with('/')) {
        return mistake("needs a path that begins with \"/\"");
    }
    if (rest.empty() || rest.find('\0') != std::string_view::npos) {
        return mistake("needs something behind the \":\"");
    }
    return kind->make({rest, root});
}

} // namespace halyard::linux_
