// What the tests of the driver statistics share.
#pragma once

#include <gmock/gmock.h>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "drivers/HYReportingDriverUtility.h"
#include "testing/TestPlatform.h"

namespace halyard {

class DriverTest : public ::testing::Test {
protected:
    using Channel = platform::HWReportChannel;
    using Group = testing::FakeHWReport::Group;
    using Lines = std::vector<testing::RecordingLog::Line>;

    // Internal builds keep the batch, which these tests look at.
    DriverTest() { platform_.deviceProperties.booleans["InternalBuild"] = true; }

    static testing::RecordingLog::Line line(LogLevel level, std::string text) {
        return {level, std::string(HYReportingDriverUtilityCategory), std::move(text)};
    }
    Group& group(const std::string& description) { return platform_.hwReport.groups[description]; }
    static std::vector<std::string> descriptions(const HYReportingDriverUtility& utility) {
        std::vector<std::string> result;
        for (const auto& subscription : utility.ioChannelSubscriptions()) {
            result.push_back(subscription.driver()->description());
        }
        return result;
    }

    static Channel simple(std::string_view name, std::int64_t value) {
        Channel channel;
        channel.format = platform::kHWReportFormatSimple;
        channel.group = "Speaker";
        channel.name = name;
        channel.value = value;
        return channel;
    }
    static Channel histogram(std::vector<Channel::Bucket> buckets) {
        Channel channel;
        channel.format = platform::kHWReportFormatHistogram;
        channel.group = "Speaker";
        channel.name = "Latency";
        channel.unit = "ms";
        channel.buckets = std::move(buckets);
        return channel;
    }
    static Channel states(std::vector<Channel::State> states) {
        Channel channel;
        channel.format = platform::kHWReportFormatState;
        channel.group = "Speaker";
        channel.name = "Power";
        channel.states = std::move(states);
        return channel;
    }

    testing::TestPlatform platform_;
};

} // namespace halyard
