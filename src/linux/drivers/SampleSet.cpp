#include "linux/drivers/SampleSet.h"

#include <algorithm>
#include <limits>

namespace halyard::linux_ {

using platform::HWReportChannel;

// One entry of a set, as the core reads it. What is asked past its end is 0.
class SampledChannel final : public HWReportChannel {
public:
    SampledChannel(const SampleSet& set, std::size_t index)
        : facts_(*set.list_->channels[index]), entry_(set.entries_[index]),
          numbers_(set.numbers(entry_)), elapsed_(set.elapsed_) {}

    std::uint8_t getFormat() const override {
        switch (facts_.names.format) {
        case ChannelFormat::Simple:
            return platform::kHWReportFormatSimple;
        case ChannelFormat::State:
            return platform::kHWReportFormatState;
        case ChannelFormat::Histogram:
            return platform::kHWReportFormatHistogram;
        }
        return 0;
    }
    Text getDriverName() const override { return unlessEmpty(facts_.names.driver); }
    Text getGroup() const override { return text(facts_.names.group); }
    Text getSubGroup() const override { return text(facts_.names.subgroup); }
    Text getChannelName() const override { return facts_.names.name; }
    Text getUnitLabel() const override { return unlessEmpty(facts_.names.unit); }

    std::int64_t simpleGetIntegerValue() const override {
        return facts_.names.format == ChannelFormat::Simple ? signedNumber(0) : 0;
    }
    std::int32_t histogramGetBucketCount() const override {
        return entry_.shape != nullptr ? static_cast<std::int32_t>(entry_.shape->bounds.size()) : 0;
    }
    int histogramGetBucketBounds(std::int32_t index, std::int64_t& lower,
                                 std::int64_t& upper) const override {
        if (index < 0 || index >= histogramGetBucketCount()) {
            return static_cast<int>(std::errc::invalid_argument);
        }
        std::tie(lower, upper) = entry_.shape->bounds[static_cast<std::size_t>(index)];
        return 0;
    }
    std::int64_t histogramGetBucketHits(std::int32_t index) const override {
        return index >= 0 ? signedNumber(static_cast<std::size_t>(index)) : 0;
    }
    // To within the buckets: what is kept of a value is the bucket it fell into.
    std::int64_t histogramGetMinValue() const override { return hitBounds().first; }
    std::int64_t histogramGetMaxValue() const override { return hitBounds().second; }

    std::int32_t stateGetCount() const override {
        return entry_.shape != nullptr ? static_cast<std::int32_t>(entry_.shape->states.size()) : 0;
    }
    Text stateGetNameForIndex(std::int32_t index) const override {
        return index >= 0 && index < stateGetCount()
                   ? Text(entry_.shape->states[static_cast<std::size_t>(index)])
                   : std::nullopt;
    }
    std::uint64_t stateGetInTransitions(std::int32_t index) const override {
        return index >= 0 ? number(2 * static_cast<std::size_t>(index) + 1) : 0;
    }
    std::uint64_t stateGetResidency(std::int32_t index) const override {
        return index >= 0 ? number(2 * static_cast<std::size_t>(index)) : 0;
    }
    double stateGetDutyCycle(std::int32_t index) const override {
        if (!elapsed_ || elapsed_->count() <= 0) {
            return 0;
        }
        const double seconds = std::chrono::duration<double>(*elapsed_).count();
        const double resident = static_cast<double>(stateGetResidency(index)) /
                                static_cast<double>(facts_.residencyPerSecond);
        // Kernels book the time of a state when it is left, so a long one may be
        // booked late and would seem longer than the time there was.
        return std::min(resident / seconds, 1.0);
    }

private:
    static Text text(const std::optional<std::string>& name) {
        return name ? Text(*name) : std::nullopt;
    }
    static Text unlessEmpty(const std::string& name) {
        return name.empty() ? std::nullopt : Text(name);
    }
    std::uint64_t number(std::size_t index) const {
        return index < entry_.count ? numbers_[index] : 0;
    }
    std::int64_t signedNumber(std::size_t index) const {
        return static_cast<std::int64_t>(number(index));
    }
    std::pair<std::int64_t, std::int64_t> hitBounds() const {
        std::optional<std::pair<std::int64_t, std::int64_t>> hit;
        for (std::int32_t index = 0; index < histogramGetBucketCount(); ++index) {
            if (number(static_cast<std::size_t>(index)) != 0) {
                const auto& [lower, upper] = entry_.shape->bounds[static_cast<std::size_t>(index)];
                hit = hit ? std::pair(std::min(hit->first, lower), std::max(hit->second, upper))
                          : std::pair(lower, upper);
            }
        }
        return hit.value_or(std::pair(0, 0));
    }

    const ChannelFacts& facts_;
    const SampleSet::Entry& entry_;
    const std::uint64_t* const numbers_;
    const std::optional<std::chrono::nanoseconds> elapsed_;
};

void SampleSet::add(const Reading& reading) {
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
    for (std::size_t index = 0; index < entries_.size(); ++index) {
        if (entries_[index].status == ReadStatus::Read &&
            callback(SampledChannel(*this, index)) != 0) {
            return;
        }
    }
}

std::shared_ptr<const SampleSet> SampleSet::since(const SampleSet& before) const {
    auto delta = std::make_shared<SampleSet>(list_, time_);
    delta->elapsed_ = time_ - before.time_;
    for (std::size_t index = 0; index < entries_.size(); ++index) {
        delta->add(change(index, before));
    }
    return delta;
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
void subtract(std::vector<std::uint64_t>& numbers, const std::uint64_t* before, std::size_t width,
              const std::vector<std::optional<std::size_t>>& placesBefore) {
    std::vector<std::uint64_t> changed = numbers;
    for (std::size_t index = 0; index < numbers.size(); ++index) {
        const auto place = placesBefore[index / width];
        const std::uint64_t old = place ? before[*place * width + index % width] : 0;
        if (old > numbers[index]) {
            return;
        }
        changed[index] = numbers[index] - old;
    }
    numbers = std::move(changed);
}

} // namespace

Reading SampleSet::change(std::size_t index, const SampleSet& before) const {
    const Entry& now = entries_[index];
    const Entry& then = before.entries_[index];
    Reading reading;
    if (now.status != ReadStatus::Read || then.status == ReadStatus::Failed) {
        return reading; // Nobody knows what it changed from, or to.
    }
    reading.status = ReadStatus::Read;
    reading.shape = now.shape;
    reading.numbers.assign(numbers(now), numbers(now) + now.count);
    if (then.status == ReadStatus::Absent) {
        return reading; // It came meanwhile: all that it counted is new.
    }
    const std::uint64_t* const old = before.numbers(then);
    if (now.shape == nullptr) {
        reading.numbers[0] = static_cast<std::uint64_t>(counterChange(
            static_cast<std::int64_t>(reading.numbers[0]), static_cast<std::int64_t>(old[0])));
    } else if (!now.shape->states.empty()) {
        subtract(reading.numbers, old, 2, places(now.shape->states, then.shape->states));
    } else {
        subtract(reading.numbers, old, 1, places(now.shape->bounds, then.shape->bounds));
    }
    return reading;
}

std::size_t SampleSet::footprint() const {
    return sizeof *this + entries_.capacity() * sizeof(Entry) +
           numbers_.capacity() * sizeof(std::uint64_t);
}

} // namespace halyard::linux_
