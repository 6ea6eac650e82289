// For tests: the statistics library over a tree of files, and what it tells, as text.
#pragma once

#include <gmock/gmock.h>
#include <optional>
#include <string>
#include <vector>

#include "linux/drivers/LinuxHWReport.h"
#include "testing/TempTree.h"
#include "testing/TestPlatform.h"

namespace halyard::linux_ {

class LinuxHWReportTest : public ::testing::Test {
protected:
    using Listing = platform::HWReportResult<platform::HWReportChannelsRef>;

    static DriverChannel channel(const std::string& name, const std::string& source,
                                 ChannelFormat format = ChannelFormat::Simple) {
        DriverChannel result;
        result.group = "Speaker";
        result.name = name;
        result.format = format;
        result.source = source;
        return result;
    }
    LinuxHWReport& library(std::vector<DriverChannel> channels) {
        return library_.emplace(platform_.clock, channels,
                                LinuxHWReport::Options{tree_.path(), std::chrono::seconds(60)});
    }
    void subscribe(const std::string& group = "Speaker") {
        const Listing listed = library_->copyChannelsInGroup(group, std::nullopt);
        subscribed_ = library_->createSubscription(*listed.value);
    }
    platform::HWReportSamplesRef sample() {
        auto result = library_->createSamples(subscribed_.subscription, subscribed_.channels.get());
        EXPECT_FALSE(result.error);
        return result.value;
    }
    // "name=value" of the simple channels.
    std::vector<std::string> delta(const platform::HWReportSamples* before,
                                   const platform::HWReportSamples& after) {
        std::vector<std::string> result;
        library_->iterate(*library_->createSamplesDelta(before, after).value,
                          [&](const platform::HWReportChannel& each) {
                              result.push_back(std::string(*each.name) + "=" +
                                               std::to_string(each.value));
                              return 0;
                          });
        return result;
    }
    // "channel state residency duty-cycle" of the resident states.
    std::vector<std::string> states(const platform::HWReportSamples& before,
                                    const platform::HWReportSamples& after) {
        std::vector<std::string> result;
        library_->iterate(*library_->createSamplesDelta(&before, after).value,
                          [&](const platform::HWReportChannel& each) {
                              for (const auto& state : each.states) {
                                  if (state.residency != 0) {
                                      result.push_back(std::string(*each.name) + " " +
                                                       std::string(*state.name) + " " +
                                                       std::to_string(state.residency) + " " +
                                                       std::to_string(state.dutyCycle));
                                  }
                              }
                              return 0;
                          });
        return result;
    }
    bool logged(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingPlatformCategory, text);
    }

    testing::TestPlatform platform_;
    testing::TempTree tree_;
    std::optional<LinuxHWReport> library_;
    platform::HWReportSubscribed subscribed_;
};

} // namespace halyard::linux_
