#include "GlitchFinder.h"

#include <algorithm>
#include <utility>

namespace halyard::pipewire {

namespace {

// A clock that is farther off than this is no clock.
constexpr Nanoseconds kMostLateness = 3'600'000'000'000;
constexpr std::size_t kMaxDrivers = 256;
// A driver this late has left its device without sound, whoever caught up with it.
constexpr Nanoseconds kVeryLate = 50'000'000;

bool isUnfinished(const NodeCycle& node) {
    return node.progress == Progress::Triggered || node.progress == Progress::Awake;
}

// Of a node in one cycle, in cycles: what it did so far while it is not done.
double workOf(const NodeCycle& node, Nanoseconds start, Nanoseconds length) {
    Nanoseconds work = 0;
    if (node.progress == Progress::Finished) {
        work = node.finish - node.awake;
    } else if (node.progress == Progress::Awake) {
        work = start + length - node.awake;
    }
    return static_cast<double>(std::clamp<Nanoseconds>(work, 0, length)) /
           static_cast<double>(length);
}

// A driver that is very late passes over cycles of which nothing is told, and tells of
// some twice. What lies between what was told so far and `due`, in whole cycles: less
// than nothing when this one was told.
Nanoseconds untoldBefore(Nanoseconds due, Nanoseconds told, Nanoseconds length) {
    const Nanoseconds gap = due - told;
    if (told == 0 || gap > kMostLateness || gap < -length - length / 2) {
        return 0;
    }
    return (gap + length + length / 2) / length * length - length;
}

} // namespace

// ---- Which streams

bool GlitchFinder::begin(StreamKey key, ObjectId node, Nanoseconds now) {
    if (!streams_.contains(key) && streams_.size() >= kMaxStreams) {
        ++ignored_;
        return false;
    }
    Stream& stream = streams_[key];
    if (stream.from == 0) {
        byNode_.emplace(node, key);
    }
    stream.node = node;
    stream.from = now;
    stream.until.reset();
    stream.warm = false;
    dropStall(stream);
    return true;
}

void GlitchFinder::end(StreamKey key, Nanoseconds now, bool broken) {
    const auto found = streams_.find(key);
    if (found != streams_.end() && (!found->second.until || broken)) {
        found->second.until = found->second.until.value_or(now);
        found->second.broken = broken;
    }
}

void GlitchFinder::forget(StreamKey key) {
    const auto found = streams_.find(key);
    if (found == streams_.end()) {
        return;
    }
    auto [at, last] = byNode_.equal_range(found->second.node);
    at = std::find_if(at, last, [key](const auto& entry) { return entry.second == key; });
    if (at != last) {
        byNode_.erase(at);
    }
    streams_.erase(found);
}

// Node IDs are used again while records of an earlier node's time are still to come.
std::pair<const StreamKey, GlitchFinder::Stream>* GlitchFinder::running(ObjectId node,
                                                                        Nanoseconds at) {
    const auto [first, last] = byNode_.equal_range(node);
    for (auto entry = first; entry != last; ++entry) {
        auto& found = *streams_.find(entry->second);
        if (at >= found.second.from && (!found.second.until || at < *found.second.until)) {
            return &found;
        }
    }
    return nullptr;
}

// ---- What a record says

// A cycle that somebody missed is told twice when the next one begins, the first
// time with the driver's old signal, and its clock shows that next one's time.
std::optional<GlitchFinder::Moment> GlitchFinder::momentOf(const Cycle& cycle) {
    const NodeCycle& device = cycle.driver;
    const Nanoseconds length = cycle.length();
    Driver& driver = drivers_.try_emplace(device.id, Driver{.missedSoFar = cycle.driverMissedSoFar})
                         .first->second;
    if (device.previousSignal == device.signal || device.signal <= driver.signal) {
        return std::nullopt;
    }
    Moment moment{.cycle = &cycle, .start = device.signal, .length = length, .driver = device.id};
    moment.incomplete = std::any_of(cycle.followers.begin(), cycle.followers.end(), isUnfinished);
    const Nanoseconds due = cycle.clock - (moment.incomplete ? length : 0);
    moment.lateness = device.signal - due;
    if (moment.lateness < 0 || moment.lateness > kMostLateness) {
        moment.lateness = 0;
    }
    const bool counted = cycle.driverMissedSoFar > driver.missedSoFar;
    if (moment.lateness >= std::max(length, driver.length)) {
        const bool veryLate = moment.lateness >= std::max(2 * length, kVeryLate);
        moment.late = counted || moment.incomplete || veryLate || driver.late;
        moment.skipped = untoldBefore(due, driver.nextDue, length);
        moment.start = due - moment.skipped;
    } else {
        moment.late = counted;
    }
    driver = {.seen = moment.start + moment.skipped,
              .signal = device.signal,
              .length = length,
              .nextDue = std::max(driver.nextDue, due + length),
              .missedSoFar = cycle.driverMissedSoFar,
              .late = moment.late};
    return moment.skipped + length > 0 ? std::optional(moment) : std::nullopt;
}

void GlitchFinder::take(const Cycle& cycle) {
    if (streams_.empty() || drivers_.size() > kMaxDrivers) {
        drivers_.clear();
    }
    if (streams_.empty()) {
        return;
    }
    const auto moment = momentOf(cycle);
    if (!moment) {
        return;
    }
    for (const NodeCycle& node : cycle.followers) {
        if (auto* const found = running(node.id, moment->start)) {
            look(found->first, found->second, node, *moment);
        }
    }
}

void GlitchFinder::look(StreamKey key, Stream& stream, const NodeCycle& node,
                        const Moment& moment) {
    if (stream.driver != moment.driver) {
        stream.driver = moment.driver;
        stream.warm = false;
        dropStall(stream);
    }
    // One that was not told to work waits for another that is not done, or takes no part.
    const bool waits = node.progress == Progress::NotTriggered && moment.incomplete;
    const bool takesPart = isUnfinished(node) || waits || node.progress == Progress::Finished;
    if (!takesPart || moment.start == stream.lastStart) {
        return;
    }
    const bool uncounted = countsMore(stream, node);
    const bool missed = moment.late || isUnfinished(node) || waits || uncounted;
    stream.lastStart = moment.start;
    if (!missed) {
        recover(stream, node, moment);
        stream.warm = true;
    } else if (stream.warm) {
        miss(key, stream, node, moment);
    }
}

// By the server's own count it missed one of which no record came. The count also
// rises when a stream recovers, and means nothing then.
bool GlitchFinder::countsMore(Stream& stream, const NodeCycle& node) {
    const auto before = std::exchange(stream.missedSoFar, node.missedSoFar);
    return before && node.missedSoFar && *node.missedSoFar > *before && !stream.episode;
}

void GlitchFinder::weighOthers(Episode& episode, const NodeCycle& node, const Moment& moment) {
    double sum = 0;
    for (const NodeCycle& other : moment.cycle->followers) {
        if (other.id != node.id) {
            const double work = workOf(other, moment.start, moment.length);
            sum += work;
            episode.largestOther = std::max(episode.largestOther, work);
        }
    }
    episode.othersCycles = std::max(episode.othersCycles, sum);
}

Nanoseconds GlitchFinder::gapOf(const Episode& episode) {
    return std::max(kGap, 2 * episode.cycleLength);
}

// Records come in portions: what they tell may be two episodes.
Episode& GlitchFinder::episodeOf(StreamKey key, Stream& stream, Nanoseconds start) {
    if (stream.episode && start - stream.episode->end >= gapOf(*stream.episode)) {
        close(stream);
    }
    if (!stream.episode) {
        stream.episode = Episode{.stream = key, .driver = stream.driver, .start = start};
        stream.told = false;
        if (opened) {
            opened(*stream.episode);
        }
    }
    return *stream.episode;
}

void GlitchFinder::miss(StreamKey key, Stream& stream, const NodeCycle& node,
                        const Moment& moment) {
    Episode& episode = episodeOf(key, stream, moment.start);
    const Nanoseconds missing = moment.skipped + moment.length;
    const auto cycles = static_cast<std::uint64_t>((missing + moment.length / 2) / moment.length);
    episode.end = std::max(episode.end, moment.start + missing);
    episode.missing += missing;
    episode.cycleLength = moment.length;
    episode.cycles += cycles;
    if (moment.late) {
        episode.lateCycles += cycles;
        episode.lateness = std::max(episode.lateness, moment.lateness);
        return;
    }
    weighOthers(episode, node, moment);
    if (!isUnfinished(node)) {
        episode.waitedForOthers = node.progress == Progress::NotTriggered;
        return;
    }
    if (!stream.stall) {
        stream.stall = Stall{.begin = std::max(node.signal, moment.start), .awake = 0};
    }
    if (node.progress == Progress::Awake && stream.stall->awake == 0) {
        stream.stall->awake = node.awake;
        episode.woke = true;
    }
}

// What held it up ended when it woke for this cycle, late, or with its work.
void GlitchFinder::recover(Stream& stream, const NodeCycle& node, const Moment& moment) {
    if (!stream.stall || !stream.episode) {
        return;
    }
    const Nanoseconds done = node.awake > node.signal ? node.awake : node.finish;
    Episode& episode = *stream.episode;
    episode.held += std::max<Nanoseconds>(0, done - stream.stall->begin);
    if (stream.stall->awake != 0 && moment.length > 0) {
        const auto work = static_cast<double>(done - stream.stall->awake);
        episode.busyCycles =
            std::max(episode.busyCycles, work / static_cast<double>(moment.length));
    }
    stream.stall.reset();
}

void GlitchFinder::infer(StreamKey key, Nanoseconds start, Nanoseconds length) {
    const auto found = streams_.find(key);
    if (found == streams_.end() || length <= 0) {
        return;
    }
    Episode& episode = episodeOf(key, found->second, start);
    episode.inferred = true;
    episode.end = std::max(episode.end, start + length);
    episode.missing += length;
    episode.cycleLength = length;
    ++episode.cycles;
}

// ---- When an episode is over

const Episode* GlitchFinder::episode(StreamKey key) const {
    const auto found = streams_.find(key);
    return found != streams_.end() && found->second.episode ? &*found->second.episode : nullptr;
}

Nanoseconds GlitchFinder::cycleLength(StreamKey key) const {
    const auto found = streams_.find(key);
    if (found == streams_.end()) {
        return 0;
    }
    const auto driver = drivers_.find(found->second.driver);
    return driver != drivers_.end() ? driver->second.length : 0;
}

bool GlitchFinder::pending(StreamKey key, Nanoseconds now) const {
    const auto found = streams_.find(key);
    if (found == streams_.end() || !found->second.until) {
        return false;
    }
    const auto driver = drivers_.find(found->second.driver);
    const bool seenPast = driver != drivers_.end() && driver->second.seen >= *found->second.until;
    return !seenPast && now - *found->second.until < kPatience;
}

bool GlitchFinder::waiting(Nanoseconds now) const {
    return std::any_of(streams_.begin(), streams_.end(), [now](const auto& entry) {
        const Stream& stream = entry.second;
        return stream.episode || !stream.until || now - *stream.until < kPatience;
    });
}

bool GlitchFinder::isOver(const Stream& stream, Nanoseconds now) const {
    const Episode& episode = *stream.episode;
    const Nanoseconds gap = gapOf(episode);
    const auto driver = drivers_.find(stream.driver);
    const Nanoseconds seen = driver != drivers_.end() ? driver->second.seen : 0;
    if (seen - episode.end >= gap || now - episode.end >= std::max(kPatience, gap)) {
        return true;
    }
    return stream.until && seen >= *stream.until;
}

// The last cycle or two of a stream that is being stopped.
bool GlitchFinder::isEnding(const Stream& stream) {
    const Episode& episode = *stream.episode;
    const Nanoseconds ending = std::max(kEnding, 2 * episode.cycleLength);
    return stream.until && !stream.broken && !episode.inferred &&
           episode.end > *stream.until - ending && episode.end - episode.start <= ending;
}

// What still holds it up has done so until the last missed cycle's end, at least.
Episode GlitchFinder::soFar(const Stream& stream) {
    Episode episode = *stream.episode;
    if (stream.stall) {
        episode.held += std::max<Nanoseconds>(0, episode.end - stream.stall->begin);
    }
    return episode;
}

// Another device, or another run, begins anew.
void GlitchFinder::dropStall(Stream& stream) {
    if (stream.episode) {
        stream.episode = soFar(stream);
    }
    stream.stall.reset();
}

void GlitchFinder::close(Stream& stream) {
    dropStall(stream);
    const Episode episode = *stream.episode;
    const bool ending = isEnding(stream);
    stream.episode.reset();
    if (!ending && tell) {
        tell(episode, true);
    }
}

void GlitchFinder::due(Nanoseconds now) {
    for (auto& [key, stream] : streams_) {
        if (!stream.episode) {
            continue;
        }
        if (isOver(stream, now)) {
            close(stream);
        } else if (!stream.told && stream.episode->end - stream.episode->start >= kLong) {
            stream.told = true;
            if (tell) {
                tell(soFar(stream), false);
            }
        }
    }
}

void GlitchFinder::flush() {
    for (auto& [key, stream] : streams_) {
        if (stream.episode) {
            close(stream);
        }
    }
}

} // namespace halyard::pipewire
