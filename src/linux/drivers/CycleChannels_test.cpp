#include "linux/drivers/CycleChannels.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <sys/stat.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr std::uint32_t kOther = 12345;

class CycleChannelsTest : public ::testing::Test {
protected:
    CycleChannelsTest() { EXPECT_TRUE(SharedFolder::make(tree_ / "cycles").ok()); }

    void write(const std::string& name, std::string_view text) {
        tree_.write("cycles/" + name, text);
    }
    void writeCounts(const std::string& stem, int cycles, int missed) {
        write(stem + ".counts", "direction sink\ncycles " + std::to_string(cycles) + "\nmissed " +
                                    std::to_string(missed) + "\n");
    }
    // "driver/name=numbers" of each channel that can be read.
    std::vector<std::string> readings() {
        std::vector<std::string> result;
        facts_.clear();
        failed_.clear();
        all_ = channels_.read({}, [&](const ChannelFactsRef& facts, bool&, const Reading& reading) {
            const std::string name = facts->names.driver + "/" + facts->names.name;
            facts_[name] = facts;
            if (reading.status == ReadStatus::Failed) {
                failed_.push_back(name);
            }
            if (reading.status == ReadStatus::Read) {
                result.push_back(name + "=" + ::testing::PrintToString(reading.numbers));
            }
        });
        return result;
    }
    std::vector<std::string> drivers() {
        std::vector<std::string> result;
        for (const std::string& reading : readings()) {
            result.push_back(reading.substr(0, reading.find('/')));
        }
        result.erase(std::unique(result.begin(), result.end()), result.end());
        return result;
    }
    fs::path path(const std::string& name) const { return tree_ / ("cycles/" + name); }

    testing::TempTree tree_;
    std::vector<std::string> taken_;
    CycleChannels channels_{
        std::make_shared<SharedFolder>(tree_ / "cycles",
                                       [](std::uint32_t uid) { return uid == ::geteuid(); }),
        std::make_shared<SourceRoot>(), CycleChannels::kDirections[0],
        [this](const DriverChannel& names) {
            return std::find(taken_.begin(), taken_.end(), names.name) != taken_.end();
        }};
    std::map<std::string, ChannelFactsRef> facts_;
    std::vector<std::string> failed_;
    bool all_ = false;
};

TEST_F(CycleChannelsTest, ADeviceHasFiveChannels) {
    writeCounts("out-alsa%20card", 100, 3);
    write("out-alsa%20card.wait", "0 10 5\n10 20 95\n");
    write("out-alsa%20card.busy", "0 10 100\n10 20 0\n");
    write("out-alsa%20card.cycle", "10 20 100\n");
    EXPECT_THAT(readings(), ElementsAre("alsa card/Cycles={ 100 }", "alsa card/Missed cycles={ 3 }",
                                        "alsa card/Wait={ 5, 95 }", "alsa card/Busy={ 100, 0 }",
                                        "alsa card/Cycle time={ 100 }"));
    EXPECT_TRUE(all_);
    const DriverChannel& cycles = facts_["alsa card/Cycles"]->names;
    EXPECT_EQ(cycles.group, "Speaker");
    EXPECT_EQ(cycles.format, ChannelFormat::Simple);
    EXPECT_EQ(cycles.source, "field:" + path("out-alsa%20card.counts").native() + ":cycles:2");
    const DriverChannel& wait = facts_["alsa card/Wait"]->names;
    EXPECT_EQ(wait.format, ChannelFormat::Histogram);
    EXPECT_EQ(wait.unit, "us");
}

TEST_F(CycleChannelsTest, DevicesComeAndGo) {
    EXPECT_THAT(drivers(), IsEmpty());
    writeCounts("out-a", 1, 0);
    EXPECT_THAT(drivers(), ElementsAre("a"));
    writeCounts("out-b", 1, 0);
    EXPECT_THAT(drivers(), ElementsAre("a", "b"));
    fs::remove(path("out-a.counts"));
    EXPECT_THAT(drivers(), ElementsAre("b"));
    fs::remove_all(tree_ / "cycles");
    EXPECT_THAT(drivers(), IsEmpty());
    EXPECT_TRUE(all_);
}

TEST_F(CycleChannelsTest, OnlyFilesOfTheDirectionAreADevices) {
    writeCounts("in-a", 1, 0);
    writeCounts(".out-a", 1, 0);
    writeCounts("out-", 1, 0);
    writeCounts("out-%", 1, 0);
    write("out-a.wait", "0 10 5\n");
    write("counts", "");
    EXPECT_THAT(drivers(), IsEmpty());
    EXPECT_TRUE(all_);
}

TEST_F(CycleChannelsTest, AFileThatIsBrokenCostsItsChannelOnly) {
    writeCounts("out-a", 7, 0);
    write("out-a.wait", "nonsense\n");
    write("out-a.busy", "0 10 99999999999999999999999999\n");
    write("out-a.cycle", "10 20 5\n");
    EXPECT_THAT(readings(),
                ElementsAre("a/Cycles={ 7 }", "a/Missed cycles={ 0 }", "a/Cycle time={ 5 }"));
    EXPECT_THAT(failed_, ElementsAre("a/Wait", "a/Busy"));
    write("out-a.counts", "cycles 99999999999999999999\nmissed -\n");
    EXPECT_THAT(readings(), ElementsAre("a/Cycle time={ 5 }"));
}

TEST_F(CycleChannelsTest, FilesHaveSoManyBytesAndLines) {
    writeCounts("out-a", 7, 0);
    std::string lines;
    for (int i = 0; i < 128; ++i) {
        lines += std::to_string(i) + " " + std::to_string(i + 1) + " 1\n";
    }
    write("out-a.wait", lines);
    write("out-a.busy", lines + "128 129 1\n");
    write("out-a.cycle", std::string(64 * 1024, ' ') + "\n");
    EXPECT_THAT(readings(), SizeIs(3));
    EXPECT_THAT(failed_, ElementsAre("a/Busy", "a/Cycle time"));
}

TEST_F(CycleChannelsTest, LinksPipesAndFoldersAreNoDevices) {
    tree_.write("counts", "cycles 5\nmissed 5\n");
    fs::create_symlink(tree_ / "counts", path("out-link.counts"));
    ASSERT_EQ(::mkfifo(path("out-pipe.counts").c_str(), 0600), 0);
    fs::create_directory(path("out-folder.counts"));
    EXPECT_THAT(drivers(), IsEmpty());
    EXPECT_TRUE(all_);
    writeCounts("out-a", 1, 0);
    ASSERT_EQ(::mkfifo(path("out-a.wait").c_str(), 0600), 0);
    EXPECT_THAT(drivers(), ElementsAre("a"));
    EXPECT_THAT(failed_, ElementsAre("a/Wait"));
}

TEST_F(CycleChannelsTest, FilesOfOthersAreNoDevices) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can make files of others";
    }
    for (int i = 0; i < 20; ++i) {
        const std::string stem = "out-other" + std::to_string(i);
        writeCounts(stem, 1, 0);
        ASSERT_EQ(::chown(path(stem + ".counts").c_str(), kOther, kOther), 0);
    }
    writeCounts("out-own", 1, 0);
    EXPECT_THAT(drivers(), ElementsAre("own"));
    EXPECT_TRUE(all_);
}

TEST_F(CycleChannelsTest, ThereAreSoManyDevicesAndNoMore) {
    for (std::size_t i = 0; i < CycleChannels::kMaxDevices; ++i) {
        writeCounts("out-device" + std::to_string(i), 1, 0);
    }
    const auto first = drivers();
    EXPECT_THAT(first, SizeIs(CycleChannels::kMaxDevices));
    EXPECT_TRUE(all_);
    writeCounts("out-aaa", 1, 0);
    EXPECT_EQ(drivers(), first); // They keep their places.
    EXPECT_FALSE(all_);
    fs::remove(path("out-" + first[3] + ".counts"));
    EXPECT_EQ(drivers().back(), "aaa");
    EXPECT_TRUE(all_);
}

TEST_F(CycleChannelsTest, AFloodHidesNoDeviceThatIsKnown) {
    writeCounts("out-known", 1, 0);
    EXPECT_THAT(drivers(), ElementsAre("known"));
    for (int i = 0; i < 300; ++i) {
        fs::create_symlink("nowhere", path("out-flood" + std::to_string(i) + ".counts"));
    }
    writeCounts("out-known", 2, 0);
    EXPECT_THAT(readings(), ElementsAre("known/Cycles={ 2 }", "known/Missed cycles={ 0 }"));
    EXPECT_FALSE(all_);
}

TEST_F(CycleChannelsTest, DevicesAlikeInReportsAreNumbered) {
    writeCounts("out-my_card", 1, 0);
    EXPECT_THAT(drivers(), ElementsAre("my_card"));
    writeCounts("out-mycard", 2, 0);
    EXPECT_THAT(readings(), ElementsAre("my_card/Cycles={ 1 }", "my_card/Missed cycles={ 0 }",
                                        "mycard/Cycles 2={ 2 }", "mycard/Missed cycles 2={ 0 }"));
    writeCounts("out-my%20card%3C2%3E", 3, 0);
    EXPECT_EQ(readings().back(), "my card<2>/Missed cycles 3={ 0 }");
}

TEST_F(CycleChannelsTest, WhatIsTakenIsLeftOut) {
    taken_ = {"Cycles", "Wait"};
    writeCounts("out-a", 1, 2);
    EXPECT_THAT(readings(), ElementsAre("a/Missed cycles={ 2 }"));
    EXPECT_FALSE(facts_.contains("a/Wait"));
}

TEST(CycleDeviceNameTest, IsWhatTheFilesNameStandsFor) {
    EXPECT_EQ(cycleDeviceName("alsa_output.pci-0000_00_1f.3"), "alsa_output.pci-0000_00_1f.3");
    EXPECT_EQ(cycleDeviceName("a%20b%2F%25"), "a b/%");
    EXPECT_EQ(cycleDeviceName("long~0123456789ABCDEF"), "long~0123456789ABCDEF");
}

TEST(CycleDeviceNameTest, HasOneFormOnly) {
    for (const char* stem :
         {"", "%", "%2", "%2f", "%41", "%ZZ", "a b", "a~", "~0123456789ABCDE", "~0123456789ABCDEFA",
          "~0123456789ABCDEF.", "~0123456789abcdef", "caf\xE9"}) {
        EXPECT_EQ(cycleDeviceName(stem), std::nullopt) << stem;
    }
}

} // namespace
} // namespace halyard::linux_
