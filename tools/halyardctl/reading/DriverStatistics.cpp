#include "reading/DriverStatistics.h"

#include <charconv>
#include <cstddef>
#include <fmt/format.h>

namespace halyard::reading {
namespace {

// As many as the daemon tells of a channel.
constexpr std::size_t kMostBuckets = 1024;
constexpr std::size_t kMostStates = 128;

// Takes `what` off the front of `text`.
bool skip(std::string_view& text, std::string_view what) {
    const bool there = text.starts_with(what);
    text.remove_prefix(there ? what.size() : 0);
    return there;
}

template <class Number> bool takeNumber(std::string_view& text, Number& number) {
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc()) {
        return false;
    }
    text.remove_prefix(static_cast<std::size_t>(end - text.data()));
    return true;
}

template <class Number>
bool takeField(std::string_view& text, std::string_view name, Number& number) {
    return skip(text, name) && takeNumber(text, number);
}

// What stands before `end`, which goes with it.
std::optional<std::string_view> takeUntil(std::string_view& text, std::string_view end) {
    const std::size_t at = text.find(end);
    if (at == std::string_view::npos) {
        return std::nullopt;
    }
    const std::string_view before = text.substr(0, at);
    text.remove_prefix(at + end.size());
    return before;
}

bool takeBucket(std::string_view& text, HistogramText::Bucket& bucket) {
    return takeNumber(text, bucket.lower) && takeField(text, "-", bucket.upper) &&
           takeField(text, ":", bucket.hits);
}

bool takeState(std::string_view& text, StateText& state) {
    const auto name = skip(text, "name:") ? takeUntil(text, ",transition:") : std::nullopt;
    if (!name) {
        return false;
    }
    state.name = *name;
    return takeNumber(text, state.transitions) && takeField(text, ",residency:", state.residency) &&
           takeField(text, ",duty_cycle:", state.dutyCycle) && skip(text, ";");
}

} // namespace

std::optional<StatisticName> statisticName(std::string_view key, std::string_view kind) {
    const std::string middle = fmt::format("_{}_", kind);
    const std::size_t at = key.find(middle);
    if (at == std::string_view::npos) {
        return std::nullopt;
    }
    StatisticName name;
    std::string_view before = key.substr(0, at);
    name.channel = key.substr(at + middle.size());
    const std::size_t driver = before.find('_');
    if (driver != std::string_view::npos) {
        name.driver = before.substr(0, driver);
        before.remove_prefix(driver + 1);
    }
    name.group = before;
    return name;
}

std::optional<HistogramText> histogramIn(std::string_view text) {
    HistogramText histogram;
    std::int64_t ignored = 0;
    if (!takeField(text, "count=", ignored) || !takeField(text, ",lower=", ignored) ||
        !takeField(text, ",upper=", ignored) || !takeField(text, ",min=", histogram.min) ||
        !takeField(text, ",max=", histogram.max) || !skip(text, ",unit=")) {
        return std::nullopt;
    }
    const auto unit = takeUntil(text, "::");
    if (!unit) {
        return std::nullopt;
    }
    histogram.unit = *unit;
    HistogramText::Bucket bucket;
    do {
        if (!takeBucket(text, bucket)) {
            return std::nullopt;
        }
        histogram.buckets.push_back(bucket);
    } while (skip(text, ";") && histogram.buckets.size() < kMostBuckets);
    return histogram;
}

std::vector<StateText> statesIn(std::string_view text) {
    std::vector<StateText> states;
    StateText state;
    while (states.size() < kMostStates && takeState(text, state)) {
        states.push_back(state);
    }
    return states;
}

} // namespace halyard::reading
