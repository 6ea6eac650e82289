// The statistics library over what a Linux system tells about its drivers: the
// built-in channels and those of the operator, who may replace a built-in one by
// naming it.
//
// Which channels there are is settled at construction. An operator's sources are
// read behind a guard (see GuardedReader), because nobody knows what they are;
// the built-in ones never wait.
//
// Settled, too, is which groups grow by the devices whose cycles a program counts:
// these come and go, and are looked for at each sample (see CycleChannels).
#pragma once

#include <chrono>
#include <deque>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/CycleChannels.h"
#include "linux/drivers/DriverChannel.h"
#include "linux/drivers/GuardedReader.h"
#include "linux/drivers/SampleSet.h"
#include "linux/drivers/SharedFolder.h"
#include "platform/Clock.h"
#include "platform/HWReport.h"

namespace halyard::linux_ {

class LinuxHWReport final : public platform::HWReport {
public:
    struct Options {
        std::filesystem::path root = "/"; // of every source
        std::chrono::milliseconds patience{500};
        // Where statistics of cycles are; empty, and when nothing is there: nowhere.
        std::filesystem::path cycles = {};
        SharedFolder::Trust trusts = {}; // Whose. Required beside `cycles`.
    };

    // Borrows the clock. A channel that makes no sense is left out with an error
    // line, and listing its group then tells an error. Requires an installed
    // platform.
    LinuxHWReport(const platform::Clock& clock, const std::vector<DriverChannel>& configured,
                  Options options);

    platform::HWReportResult<platform::HWReportChannelsRef>
    copyChannelsInGroup(const std::optional<std::string>& group,
                        const std::optional<std::string>& subGroup) override;
    std::int64_t getChannelCount(const platform::HWReportChannels& channels) const override;
    platform::HWReportSubscribed
    createSubscription(const platform::HWReportChannels& channels) override;
    platform::HWReportResult<platform::HWReportSamplesRef>
    createSamples(platform::HWReportSubscription* subscription,
                  const platform::HWReportChannels* channels) override;
    // A channel that could not be read in one of the sets is not in the delta;
    // one that was not there at first has begun at zero. No previous set, no
    // channels: what they counted before is unknown.
    platform::HWReportResult<platform::HWReportSamplesRef>
    createSamplesDelta(const platform::HWReportSamples* previous,
                       const platform::HWReportSamples& current) override;
    void
    iterate(const platform::HWReportSamples& samples,
            const std::function<int(const platform::HWReportChannel&)>& callback) const override;

private:
    struct Channel {
        ChannelFactsRef facts;
        std::shared_ptr<ChannelSource> source;
        bool configured = false;
        bool failing = false; // and the log says so already
    };
    struct Subscription final : platform::HWReportSubscription {
        ChannelListRef list;
    };

    void add(const DriverChannel& names, bool configured);
    void addCycles(const Options& options);
    bool hasChannel(const DriverChannel& names) const;
    void sampleCycles(const ChannelList& list, platform::SteadyTime now, SampleSet& samples);
    std::vector<Reading> readConfigured(const ChannelList& list, platform::SteadyTime now);

    const platform::Clock& clock_;
    // Shared with the sources, some of which may never come back from a read.
    const std::shared_ptr<SourceRoot> root_ = std::make_shared<SourceRoot>();
    std::vector<Channel> channels_;
    std::vector<DriverChannel> leftOut_;
    std::deque<CycleChannels> cycles_; // that lists borrow
    std::deque<Subscription> subscriptions_;
    GuardedReader guarded_;
};

} // namespace halyard::linux_
