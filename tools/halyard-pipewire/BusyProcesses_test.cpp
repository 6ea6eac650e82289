#include "BusyProcesses.h"

#include <cmath>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::pipewire {
namespace {

constexpr Nanoseconds kSecond = 1'000'000'000;

class BusyProcessesTest : public ::testing::Test {
protected:
    // A process that was on processors for so many seconds so far.
    void process(int id, const std::string& name, double seconds) {
        const auto ticks = std::lround(seconds * static_cast<double>(sysconf(_SC_CLK_TCK)));
        tree_.write(std::to_string(id) + "/stat",
                    fmt::format("{} ({}) S 1 1 1 0 -1 4 1 0 1 0 {} {} 0 0 20 0\n", id, name,
                                ticks / 2, ticks - ticks / 2));
    }

    testing::TempTree tree_;
    BusyProcesses busy_{tree_.path()};
};

TEST_F(BusyProcessesTest, NamesTheThreeThatRanMost) {
    for (int id = 1; id <= 5; ++id) {
        process(id, "p" + std::to_string(id), 10);
    }
    busy_.look(kSecond);
    process(1, "p1", 10.2);
    process(2, "p2", 11.0);
    process(3, "p3", 10.04); // too little
    process(4, "p4", 10.5);
    process(5, "p5", 10.1);
    const Dictionaries expected{{{"name", "p2"}, {"share", 1.0}},
                                {{"name", "p4"}, {"share", 0.5}},
                                {{"name", "p1"}, {"share", 0.2}}};
    EXPECT_EQ(busy_.busiest(2 * kSecond), expected);
}

TEST_F(BusyProcessesTest, OneThatBeganSinceRanAllItsTimeSince) {
    busy_.look(kSecond);
    process(7, "new (one) here", 0.4);
    const Dictionaries expected{{{"name", "new (one) here"}, {"share", 0.2}}};
    EXPECT_EQ(busy_.busiest(3 * kSecond), expected);
}

TEST_F(BusyProcessesTest, LooksOnceASecondAndReachesBackTwo) {
    process(1, "p1", 0);
    busy_.look(kSecond);
    process(1, "p1", 1);
    busy_.look(2 * kSecond - 1); // too soon
    busy_.look(2 * kSecond);
    process(1, "p1", 1.5);
    EXPECT_EQ(busy_.busiest(3 * kSecond).at(0).get<double>("share"), 0.75);
}

TEST_F(BusyProcessesTest, WithoutALookNobodyIsNamed) {
    process(1, "p1", 10);
    EXPECT_TRUE(busy_.busiest(kSecond).empty());
}

TEST_F(BusyProcessesTest, WhatIsNoProcessIsPassedOver) {
    tree_.write("meminfo", "1");
    tree_.write("12x/stat", "1 (a) S");
    tree_.write("13/stat", "nonsense");
    busy_.look(kSecond);
    EXPECT_TRUE(busy_.busiest(2 * kSecond).empty());
}

} // namespace
} // namespace halyard::pipewire
