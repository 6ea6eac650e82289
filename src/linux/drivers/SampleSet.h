// What the channels of a subscription said at one moment, or how that changed
// between two, and the rules of the change.
//
// Sessions keep sets for as long as they run, so a set is two flat arrays; what
// its numbers stand for is shared with the sources and other sets. Unchanging;
// any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/DriverChannel.h"
#include "platform/HWReport.h"

namespace halyard::linux_ {

// What is known of a channel beside its numbers.
struct ChannelFacts {
    DriverChannel names;
    std::uint64_t residencyPerSecond = 1;
};
using ChannelFactsRef = std::shared_ptr<const ChannelFacts>;

// The channels of a listing, or of a subscription.
struct ChannelList final : platform::HWReportChannels {
    std::vector<ChannelFactsRef> channels;
    std::vector<std::size_t> places; // of the same channels in the library
    std::vector<std::size_t> cycles; // places of those that find more at each sample
};
using ChannelListRef = std::shared_ptr<const ChannelList>;

class SampleSet final : public platform::HWReportSamples {
public:
    SampleSet(ChannelListRef list, platform::SteadyTime time)
        : list_(std::move(list)), time_(time) {
        entries_.reserve(list_->channels.size());
    }

    // The next channel's. Requires fewer calls than channels in the list.
    void add(const Reading& reading);
    // Of a channel that came later than the list, told from others by its source.
    // Requires that all of the list have been added.
    void addFound(ChannelFactsRef facts, const Reading& reading);
    // There were more of these than have been added.
    void setCurtailed() { curtailed_ = true; }
    // The change from `before` to this set. Requires sets of one subscription.
    std::shared_ptr<const SampleSet> since(const SampleSet& before) const;
    // Of a channel that could be read; the caller stops it by other than 0.
    void iterate(const std::function<int(const platform::HWReportChannel&)>& callback) const;

    const ChannelListRef& list() const { return list_; }
    // In bytes, contents included.
    std::size_t footprint() const;

private:
    struct Entry {
        ReadingShapeRef shape;
        std::uint32_t first = 0; // of its numbers
        std::uint32_t count = 0;
        ReadStatus status = ReadStatus::Failed;
    };

    void append(const Reading& reading);
    const ChannelFacts& factsAt(std::size_t index) const;
    // What this set has of the channel that `later` has at `index`.
    Entry entryOf(const SampleSet& later, std::size_t index) const;
    void subtract(std::size_t index, const SampleSet& before);
    void fill(platform::HWReportChannel& channel, std::size_t index) const;
    void fillBuckets(platform::HWReportChannel& channel, const Entry& entry) const;
    void fillStates(platform::HWReportChannel& channel, const Entry& entry,
                    std::uint64_t residencyPerSecond) const;
    double dutyCycle(std::uint64_t residency, std::uint64_t perSecond) const;
    // 0 past the end of what was read.
    std::uint64_t number(const Entry& entry, std::size_t index) const {
        return index < entry.count ? numbers_[entry.first + index] : 0;
    }
    std::int64_t hits(const Entry& entry, std::size_t index) const {
        return static_cast<std::int64_t>(number(entry, index));
    }

    ChannelListRef list_;
    platform::SteadyTime time_;
    std::optional<std::chrono::nanoseconds> elapsed_; // of a change
    std::vector<ChannelFactsRef> found_;              // of the entries behind those of the list
    bool curtailed_ = false;
    std::vector<Entry> entries_;
    std::vector<std::uint64_t> numbers_;
};

} // namespace halyard::linux_
