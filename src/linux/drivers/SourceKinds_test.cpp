#include "linux/drivers/SourceKinds.h"

#include <gtest/gtest.h>
#include <utility>
#include <vector>

namespace halyard::linux_ {
namespace {

using Formats = std::vector<std::pair<const char*, ChannelFormat>>;

TEST(SourceKindsTest, EveryKindHasItsFormat) {
    for (const auto& [source, format] : Formats{{"file:/x", ChannelFormat::Simple},
                                                {"field:/x:1:1", ChannelFormat::Simple},
                                                {"pressure:/x:some", ChannelFormat::Simple},
                                                {"irq:x", ChannelFormat::Simple},
                                                {"alsa_frames:/x", ChannelFormat::Simple},
                                                {"alsa_xruns:/x", ChannelFormat::Simple},
                                                {"alsa_restarts:/x", ChannelFormat::Simple},
                                                {"alsa_states:/x", ChannelFormat::State},
                                                {"cpuidle:/x", ChannelFormat::State},
                                                {"runtime_pm:/x", ChannelFormat::State},
                                                {"cpufreq:/x", ChannelFormat::State},
                                                {"devfreq:/x", ChannelFormat::State},
                                                {"histogram:/x", ChannelFormat::Histogram},
                                                {"tracefs_hist:/x", ChannelFormat::Histogram}}) {
        const SourceKind* const kind = findSourceKind(source);
        ASSERT_NE(kind, nullptr) << source;
        EXPECT_EQ(kind->format, format) << source;
        SourceRoot root{"/nonexistent"};
        EXPECT_TRUE(makeChannelSource(source, root).ok()) << source;
    }
}

TEST(SourceKindsTest, OtherTextHasNoKind) {
    for (const char* source : {"", ":", "pie:/x", "file2:/x", "fil:/x", "File:/x"}) {
        EXPECT_EQ(findSourceKind(source), nullptr) << source;
    }
}

} // namespace
} // namespace halyard::linux_
