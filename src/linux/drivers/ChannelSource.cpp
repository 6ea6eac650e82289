#include "linux/drivers/ChannelSource.h"

#include <charconv>
#include <fmt/format.h>
#include <optional>

#include "linux/drivers/ChannelSources.h"
#include "linux/drivers/SourceText.h"

namespace halyard::linux_ {
namespace {

using Made = std::variant<std::unique_ptr<ChannelSource>, std::string>;

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
        return "needs the form field:PATH:ROW:COLUMN";
    }
    const char* const end = column->data() + column->size();
    if (std::from_chars(column->data(), end, place.column).ptr != end || place.column < 1 ||
        place.column > kMostColumn) {
        return fmt::format("COLUMN must be a number from 1 to {}", kMostColumn);
    }
    place.row = *row;
    return make<CounterSource>(order.file(),
                               [place](std::string_view text) { return parseField(text, place); });
}

Made makePressure(Order order) {
    const auto line = order.takeLast();
    if (line != "some" && line != "full") {
        return "needs the form pressure:PATH:some or pressure:PATH:full";
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

constexpr struct {
    std::string_view name;
    Made (*make)(Order order);
    bool takesPath;
} kKinds[] = {{"file", makeFile, true},
              {"field", makeField, true},
              {"pressure", makePressure, true},
              {"irq", makeInterrupt, false},
              {"cpuidle", makeCpuIdle, true},
              {"runtime_pm", makeRuntimePower, true},
              {"cpufreq", makeCpuFrequency, true},
              {"devfreq", makeDeviceFrequency, true},
              {"alsa_frames", makePcm<PcmSource::What::Frames>, true},
              {"alsa_xruns", makePcm<PcmSource::What::Xruns>, true},
              {"alsa_restarts", makePcm<PcmSource::What::Restarts>, true},
              {"alsa_states", makePcm<PcmSource::What::States>, true},
              {"histogram", makeHistogram, true},
              {"tracefs_hist", makeTraceHistogram, true}};

} // namespace

Made makeChannelSource(std::string_view source, SourceRoot& root) {
    const std::size_t colon = source.find(':');
    const std::string_view name = source.substr(0, colon);
    const std::string_view rest =
        colon == std::string_view::npos ? std::string_view() : source.substr(colon + 1);
    for (const auto& kind : kKinds) {
        if (kind.name != name) {
            continue;
        }
        if (kind.takesPath && !rest.starts_with('/')) {
            return "needs a path that begins with \"/\"";
        }
        if (rest.empty() || rest.find('\0') != std::string_view::npos) {
            return "needs something behind the \":\"";
        }
        return kind.make({rest, root});
    }
    return fmt::format("\"{}\" is no kind of source", name);
}

} // namespace halyard::linux_
