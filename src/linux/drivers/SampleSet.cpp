#include "linux/drivers/SampleSet.h"

#include <algorithm>
#include <cassert>
#include <limits>

namespace halyard::linux_ {

using platform::HWReportChannel;

namespace {

std::uint8_t reported(ChannelFormat format) {
    switch (format) {
    case ChannelFormat::Simple:
        return platform::kHWReportFormatSimple;
    case ChannelFormat::State:
        return platform::kHWReportFormatState;
    case ChannelFormat::Histogram:
        return platform::kHWReportFormatHistogram;
    }
    return 0;
}

HWReportChannel::Text unlessEmpty(const std::string& text) {
    return text.empty() ? std::nullopt : HWReportChannel::Text(text);
}

// To within the buckets: what is kept of a value is the bucket it fell into.
void setEnds(HWReportChannel& channel) {
    bool hit = false;
    for (const auto& bucket : channel.buckets) {
        if (bucket.hits != 0) {
            channel.min = hit ? std::min(channel.min, bucket.lower) : bucket.lower;
            channel.max = hit ? std::max(channel.max, bucket.upper) : bucket.upper;
            hit = true;
        }
    }
}

} // namespace

void SampleSet::add(const Reading& reading) {
    assert(entries_.size() < list_->channels.size());
    append(reading);
}

void SampleSet::addFound(ChannelFactsRef facts, const Reading& reading) {
    assert(entries_.size() == list_->channels.size() + found_.size());
    found_.push_back(std::move(facts));
    append(reading);
}

const ChannelFacts& SampleSet::factsAt(std::size_t index) const {
    const std::size_t listed = list_->channels.size();
    return index < listed ? *list_->channels[index] : *found_[index - listed];
}

void SampleSet::append(const Reading& reading) {
    Entry entry;
    entry.status = reading.status;
    if (reading.status == ReadStatus::Read) {
        entry.shape = reading.shape;
        entry.first = static_cast<std::uint32_t>(numbers_.size());
        entry.count = static_cast<std::uint32_t>(reading.numbers.size());
        numbers_.insert(numbers_.end(), reading.numbers.begin(), reading.numbers.end());
    }
    entries_.push_back(std::move(entry));
}

void SampleSet::iterate(const std::function<int(const HWReportChannel&)>& callback) const {
    HWReportChannel channel; // Its lists keep their memory from one to the next.
    for (std::size_t index = 0; index < entries_.size(); ++index) {
        if (entries_[index].status == ReadStatus::Read) {
            fill(channel, index);
            if (callback(channel) != 0) {
                return;
            }
        }
    }
}

void SampleSet::fill(HWReportChannel& channel, std::size_t index) const {
    const ChannelFacts& facts = factsAt(index);
    channel.format = reported(facts.names.format);
    channel.driver = unlessEmpty(facts.names.driver);
    channel.group = facts.names.group;
    channel.subGroup = facts.names.subgroup;
    channel.name = facts.names.name;
    channel.unit = unlessEmpty(facts.names.unit);
    const Entry& entry = entries_[index];
    channel.value = facts.names.format == ChannelFormat::Simple ? hits(entry, 0) : 0;
    fillBuckets(channel, entry);
    fillStates(channel, entry, facts.residencyPerSecond);
}

void SampleSet::fillBuckets(HWReportChannel& channel, const Entry& entry) const {
    channel.buckets.clear();
    channel.min = 0;
    channel.max = 0;
    if (entry.shape == nullptr) {
        return;
    }
    for (const auto& [lower, upper] : entry.shape->bounds) {
        channel.buckets.push_back({lower, upper, hits(entry, channel.buckets.size()), 0});
    }
    setEnds(channel);
}

void SampleSet::fillStates(HWReportChannel& channel, const Entry& entry,
                           std::uint64_t residencyPerSecond) const {
    channel.states.clear();
    if (entry.shape == nullptr) {
        return;
    }
    for (const auto& name : entry.shape->states) {
        const std::size_t at = 2 * channel.states.size();
        const std::uint64_t residency = number(entry, at);
        channel.states.push_back(
            {name, number(entry, at + 1), residency, dutyCycle(residency, residencyPerSecond)});
    }
}

double SampleSet::dutyCycle(std::uint64_t residency, std::uint64_t perSecond) const {
    if (!elapsed_ || elapsed_->count() <= 0) {
        return 0;
    }
    const double seconds = std::chrono::duration<double>(*elapsed_).count();
    const double resident = static_cast<double>(residency) / static_cast<double>(perSecond);
    // Kernels book the time of a state when it is left, so a long one may be
    // booked late and would seem longer than the time there was.
    return std::min(resident / seconds, 1.0);
}

namespace {

// A counter that went back was begun anew, by a driver that was loaded again.
std::int64_t counterChange(std::int64_t now, std::int64_t before) {
    if (now < before) {
        return now;
    }
    std::int64_t change = 0;
    return __builtin_sub_overflow(now, before, &change) ? std::numeric_limits<std::int64_t>::max()
                                                        : change;
}

// The place of every part of `now` in `before`; none for those that are new.
template <class Part>
std::vector<std::optional<std::size_t>> places(const std::vector<Part>& now,
                                               const std::vector<Part>& before) {
    std::vector<std::optional<std::size_t>> result(now.size());
    for (std::size_t index = 0; index < now.size(); ++index) {
        const auto at = std::find(before.begin(), before.end(), now[index]);
        if (at != before.end()) {
            result[index] = static_cast<std::size_t>(at - before.begin());
        }
    }
    return result;
}

// Subtracts what `before` has of the same parts, each of `width` numbers, unless
// one of them went back: then all were begun anew, as with a counter.
void subtractParts(std::uint64_t* numbers, std::size_t count, const std::uint64_t* before,
                   std::size_t width, const std::vector<std::optional<std::size_t>>& placesBefore) {
    const auto old = [&](std::size_t index) {
        const auto place = placesBefore[index / width];
        return place ? before[*place * width + index % width] : 0;
    };
    for (std::size_t index = 0; index < count; ++index) {
        if (old(index) > numbers[index]) {
            return;
        }
    }
    for (std::size_t index = 0; index < count; ++index) {
        numbers[index] -= old(index);
    }
}

} // namespace

std::shared_ptr<const SampleSet> SampleSet::since(const SampleSet& before) const {
    auto delta = std::make_shared<SampleSet>(*this);
    delta->elapsed_ = time_ - before.time_;
    for (std::size_t index = 0; index < entries_.size(); ++index) {
        delta->subtract(index, before);
    }
    return delta;
}

// A set that was curtailed does not know whether a channel that it lacks was there.
SampleSet::Entry SampleSet::entryOf(const SampleSet& later, std::size_t index) const {
    const std::size_t listed = list_->channels.size();
    if (index < listed) {
        return entries_[index];
    }
    const std::string& source = later.factsAt(index).names.source;
    const auto at = std::find_if(found_.begin(), found_.end(),
                                 [&](const auto& facts) { return facts->names.source == source; });
    if (at != found_.end()) {
        return entries_[listed + static_cast<std::size_t>(at - found_.begin())];
    }
    Entry none;
    none.status = curtailed_ ? ReadStatus::Failed : ReadStatus::Absent;
    return none;
}

void SampleSet::subtract(std::size_t index, const SampleSet& before) {
    Entry& now = entries_[index];
    const Entry then = before.entryOf(*this, index);
    if (now.status != ReadStatus::Read || then.status == ReadStatus::Failed) {
        now = Entry(); // Nobody knows what it changed from, or to.
        return;
    }
    if (then.status == ReadStatus::Absent) {
        return; // It came meanwhile: all that it counted is new.
    }
    std::uint64_t* const numbers = numbers_.data() + now.first;
    const std::uint64_t* const old = before.numbers_.data() + then.first;
    if (now.shape == nullptr) {
        numbers[0] = static_cast<std::uint64_t>(counterChange(static_cast<std::int64_t>(numbers[0]),
                                                              static_cast<std::int64_t>(old[0])));
    } else if (!now.shape->states.empty()) {
        subtractParts(numbers, now.count, old, 2, places(now.shape->states, then.shape->states));
    } else {
        subtractParts(numbers, now.count, old, 1, places(now.shape->bounds, then.shape->bounds));
    }
}

std::size_t SampleSet::footprint() const {
    return sizeof *this + found_.capacity() * sizeof(ChannelFactsRef) +
           entries_.capacity() * sizeof(Entry) + numbers_.capacity() * sizeof(std::uint64_t);
}

} // namespace halyard::linux_
