#include "linux/drivers/SourceText.h"

#include <algorithm>
#include <charconv>
#include <utility>

namespace halyard::linux_ {
namespace {

constexpr std::string_view kBlanks = " \t\r";
// In which the kernel tells times to user space, whatever it counts in itself.
constexpr std::uint64_t kMillisecondsPerTick = 10;

// Takes the part up to the next `separator`, and that, off `rest`.
std::string_view takeUntil(std::string_view& rest, char separator) {
    const std::size_t end = rest.find(separator);
    const std::string_view part = rest.substr(0, end);
    rest.remove_prefix(end == std::string_view::npos ? rest.size() : end + 1);
    return part;
}

std::string_view takeLine(std::string_view& rest) {
    return takeUntil(rest, '\n');
}

std::string_view trimmed(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(kBlanks);
    if (begin == std::string_view::npos) {
        return {};
    }
    return text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

// Empty at the end of the line.
std::string_view takeWord(std::string_view& rest) {
    const std::size_t begin = std::min(rest.find_first_not_of(kBlanks), rest.size());
    const std::size_t end = std::min(rest.find_first_of(kBlanks, begin), rest.size());
    const std::string_view word = rest.substr(begin, end - begin);
    rest.remove_prefix(end);
    return word;
}

template <class Number> std::optional<Number> number(std::string_view text) {
    Number value{};
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, value);
    const bool whole = !text.empty() && result.ec == std::errc() && result.ptr == end;
    return whole ? std::optional(value) : std::nullopt;
}

template <class Number> std::optional<Number> takeNumber(std::string_view& rest) {
    return number<Number>(takeWord(rest));
}

bool isRow(std::string_view line, std::size_t lineNumber, std::string_view row) {
    if (const auto wanted = number<std::size_t>(row)) {
        return lineNumber == *wanted;
    }
    std::string_view label = takeWord(line);
    if (label == row) {
        return true;
    }
    return label.ends_with(':') && label.substr(0, label.size() - 1) == row;
}

bool add(std::uint64_t& sum, std::uint64_t value) {
    return !__builtin_add_overflow(sum, value, &sum);
}

SourceState* findState(SourceStates& states, std::string_view name) {
    const auto at = std::find_if(states.begin(), states.end(),
                                 [&](const SourceState& state) { return state.name == name; });
    return at != states.end() ? &*at : nullptr;
}

// Adds the state, to the one of its name if that is there; false when it does not
// fit.
bool join(SourceStates& states, const SourceState& state) {
    if (SourceState* const same = findState(states, state.name)) {
        return add(same->residency, state.residency) && add(same->transitions, state.transitions);
    }
    if (states.size() == kMaxSourceStates) {
        return false;
    }
    states.push_back(state);
    return true;
}

} // namespace

std::optional<std::int64_t> parseInteger(std::string_view text) {
    while (text.ends_with('\n')) {
        text.remove_suffix(1);
    }
    return number<std::int64_t>(trimmed(text));
}

std::optional<std::int64_t> parseField(std::string_view text, const FieldPlace& place) {
    for (std::size_t lineNumber = 1; !text.empty(); ++lineNumber) {
        std::string_view line = takeLine(text);
        if (!isRow(line, lineNumber, place.row)) {
            continue;
        }
        std::string_view word;
        for (std::size_t column = 0; column < place.column; ++column) {
            word = takeWord(line);
            if (word.empty()) {
                return std::nullopt;
            }
        }
        const std::size_t sign = word.rfind('=');
        return number<std::int64_t>(sign == std::string_view::npos ? word : word.substr(sign + 1));
    }
    return std::nullopt;
}

std::optional<std::int64_t> parsePressure(std::string_view text, std::string_view wanted) {
    constexpr std::string_view kTotal = "total=";
    while (!text.empty()) {
        std::string_view line = takeLine(text);
        if (takeWord(line) != wanted) {
            continue;
        }
        while (!line.empty()) {
            const std::string_view word = takeWord(line);
            if (word.starts_with(kTotal)) {
                return number<std::int64_t>(word.substr(kTotal.size()));
            }
        }
    }
    return std::nullopt;
}

std::optional<std::uint64_t> parsePerCpuCount(std::string_view text) {
    std::string_view line = trimmed(takeLine(text));
    if (line.empty()) {
        return std::nullopt;
    }
    std::uint64_t sum = 0;
    while (!line.empty()) {
        const auto count = number<std::uint64_t>(takeUntil(line, ','));
        if (!count || !add(sum, *count)) {
            return std::nullopt;
        }
    }
    return sum;
}

std::optional<SourceStates> parseTimeInState(std::string_view text) {
    SourceStates states;
    while (!text.empty()) {
        std::string_view line = takeLine(text);
        const std::string_view name = takeWord(line);
        if (name.empty()) {
            continue;
        }
        const auto ticks = takeNumber<std::uint64_t>(line);
        std::uint64_t time = 0;
        if (!ticks || __builtin_mul_overflow(*ticks, kMillisecondsPerTick, &time) ||
            !join(states, {std::string(name), time, 0})) {
            return std::nullopt;
        }
    }
    return states.empty() ? std::nullopt : std::optional(std::move(states));
}

namespace {

// The states that the header's line, what stands after its ":", names.
std::optional<SourceStates> statesOfHeader(std::string_view header) {
    SourceStates states;
    for (;;) {
        const std::string_view word = takeWord(header);
        if (word.empty() || word.starts_with("time")) {
            break;
        }
        if (states.size() == kMaxSourceStates) {
            return std::nullopt;
        }
        states.push_back({std::string(word), 0, 0});
    }
    return states.empty() ? std::nullopt : std::optional(std::move(states));
}

// Adds a row's counts, which may be fewer than the states, to the transitions.
bool addRow(SourceStates& states, SourceState& from, std::string_view row, bool withTime) {
    for (SourceState& to : states) {
        const auto count = takeNumber<std::uint64_t>(row);
        if (!count || !add(to.transitions, *count)) {
            return false;
        }
    }
    if (!withTime) {
        return true;
    }
    const auto time = takeNumber<std::uint64_t>(row);
    return time && add(from.residency, *time);
}

std::optional<SourceStates> joined(const SourceStates& states) {
    SourceStates result;
    for (const SourceState& state : states) {
        if (!join(result, state)) {
            return std::nullopt;
        }
    }
    return result;
}

// Both tables: a line "From : To", one of the states after ":", then a row for
// each state, "*" before the current one.
std::optional<SourceStates> parseTransitions(std::string_view text, bool withTime) {
    const std::string_view title = takeLine(text);
    if (title.find("From") == std::string_view::npos) {
        return std::nullopt;
    }
    std::string_view header = takeLine(text);
    takeUntil(header, ':');
    auto states = statesOfHeader(header);
    std::size_t rows = 0;
    while (states && !text.empty()) {
        std::string_view row = takeLine(text);
        std::string_view name = trimmed(takeUntil(row, ':'));
        if (name.starts_with('*')) {
            name = trimmed(name.substr(1));
        }
        SourceState* const from = findState(*states, name);
        if (from == nullptr) {
            break; // "Total transition : 7", or the end
        }
        if (++rows > states->size() || !addRow(*states, *from, row, withTime)) {
            return std::nullopt;
        }
    }
    return states && rows == states->size() ? joined(*states) : std::nullopt;
}

} // namespace

std::optional<SourceStates> parseTransitionTable(std::string_view text) {
    return parseTransitions(text, false);
}

std::optional<SourceStates> parseTransitionStatistics(std::string_view text) {
    return parseTransitions(text, true);
}

namespace {

std::pair<std::int64_t, std::int64_t> boundsOf(const SourceBucket& bucket) {
    return {bucket.lower, bucket.upper};
}

// Those of the same bounds as one, where the first of them stood.
std::optional<SourceBuckets> joined(SourceBuckets buckets) {
    const auto notAscending = [](const SourceBucket& left, const SourceBucket& right) {
        return boundsOf(left) >= boundsOf(right);
    };
    if (std::adjacent_find(buckets.begin(), buckets.end(), notAscending) == buckets.end()) {
        return buckets; // As nearly all are, and so none is there twice.
    }
    SourceBuckets result;
    for (const SourceBucket& bucket : buckets) {
        const auto same = std::find_if(result.begin(), result.end(), [&](const SourceBucket& each) {
            return boundsOf(each) == boundsOf(bucket);
        });
        if (same == result.end()) {
            result.push_back(bucket);
        } else if (!add(same->hits, bucket.hits)) {
            return std::nullopt;
        }
    }
    return result;
}

} // namespace

std::optional<SourceBuckets> parseBuckets(std::string_view text) {
    SourceBuckets buckets;
    while (!text.empty()) {
        std::string_view line = takeLine(text);
        line = trimmed(line.substr(0, line.find('#')));
        if (line.empty()) {
            continue;
        }
        const auto lower = takeNumber<std::int64_t>(line);
        const auto upper = takeNumber<std::int64_t>(line);
        const auto hits = takeNumber<std::uint64_t>(line);
        if (!lower || !upper || !hits || !trimmed(line).empty() ||
            buckets.size() == kMaxSourceBuckets) {
            return std::nullopt;
        }
        buckets.push_back({*lower, *upper, *hits});
    }
    return buckets.empty() ? std::nullopt : joined(std::move(buckets));
}

namespace {

// "7", "~ 10-19" or "~ 2^3": a value, a range, or the values from 2^2 to 2^3.
std::optional<SourceBucket> bucketOfKey(std::string_view key) {
    key = trimmed(key);
    if (!key.starts_with('~')) {
        const auto value = number<std::int64_t>(key);
        return value ? std::optional(SourceBucket{*value, *value, 0}) : std::nullopt;
    }
    key = trimmed(key.substr(1));
    if (key.starts_with("2^")) {
        const auto power = number<unsigned>(key.substr(2));
        if (!power || *power > 62) {
            return std::nullopt;
        }
        const std::int64_t upper = std::int64_t{1} << *power;
        return SourceBucket{*power == 0 ? 0 : upper / 2, upper, 0};
    }
    const std::size_t dash = key.find('-', 1);
    if (dash == std::string_view::npos) {
        return std::nullopt;
    }
    const auto lower = number<std::int64_t>(key.substr(0, dash));
    const auto upper = number<std::int64_t>(key.substr(dash + 1));
    return lower && upper ? std::optional(SourceBucket{*lower, *upper, 0}) : std::nullopt;
}

// "{ latency: ~ 10-19 } hitcount:          3"
std::optional<SourceBucket> bucketOfEntry(std::string_view line) {
    constexpr std::string_view kHits = "hitcount:";
    takeUntil(line, ':');
    auto bucket = bucketOfKey(takeUntil(line, '}'));
    const std::size_t label = line.find(kHits);
    if (!bucket || label == std::string_view::npos) {
        return std::nullopt;
    }
    line.remove_prefix(label + kHits.size());
    const auto hits = takeNumber<std::uint64_t>(line);
    if (!hits) {
        return std::nullopt;
    }
    bucket->hits = *hits;
    return bucket;
}

} // namespace

std::optional<SourceBuckets> parseTraceHistogram(std::string_view text) {
    SourceBuckets buckets;
    bool isHistogram = false;
    while (!text.empty()) {
        const std::string_view line = takeLine(text);
        isHistogram = isHistogram || line.starts_with("# event histogram");
        if (!line.starts_with('{')) {
            continue;
        }
        const auto bucket = bucketOfEntry(line);
        if (!bucket || buckets.size() == kMaxSourceBuckets) {
            return std::nullopt;
        }
        buckets.push_back(*bucket);
    }
    std::sort(buckets.begin(), buckets.end(),
              [](const SourceBucket& left, const SourceBucket& right) {
                  return boundsOf(left) < boundsOf(right);
              });
    // One without hits yet is a histogram all the same.
    return isHistogram ? joined(std::move(buckets)) : std::nullopt;
}

namespace {

// "12.000345678", seconds and nine digits.
std::optional<std::chrono::nanoseconds> parseStamp(std::string_view text) {
    constexpr std::int64_t kMostSeconds = 9'000'000'000;
    const std::size_t point = text.find('.');
    if (point == std::string_view::npos || text.size() - point - 1 != 9) {
        return std::nullopt;
    }
    const auto seconds = number<std::int64_t>(text.substr(0, point));
    const auto nanoseconds = number<std::uint32_t>(text.substr(point + 1));
    if (!seconds || !nanoseconds || *seconds < 0 || *seconds > kMostSeconds) {
        return std::nullopt;
    }
    return std::chrono::seconds(*seconds) + std::chrono::nanoseconds(*nanoseconds);
}

} // namespace

std::optional<PcmStatus> parsePcmStatus(std::string_view text) {
    PcmStatus status;
    while (!text.empty()) {
        std::string_view line = takeLine(text);
        const std::string_view key = trimmed(takeUntil(line, ':'));
        const std::string_view value = trimmed(line);
        if (key == "closed") {
            status.state = "CLOSED";
        } else if (key == "state") {
            status.state = value;
        } else if (key == "owner_pid") {
            status.owner = number<std::int64_t>(value);
        } else if (key == "trigger_time") {
            status.triggered = parseStamp(value);
        } else if (key == "tstamp") {
            status.stamped = parseStamp(value);
        } else if (key == "hw_ptr") {
            status.frames = number<std::int64_t>(value);
        }
    }
    return status.state.empty() ? std::nullopt : std::optional(std::move(status));
}

} // namespace halyard::linux_
