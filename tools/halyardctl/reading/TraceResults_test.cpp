#include "reading/TraceResults.h"

#include <gtest/gtest.h>

#include "testing/TempTree.h"

namespace halyard::reading {
namespace {

std::string entry(const std::string& name, double time, const std::string& more = "") {
    return "{\"name\":\"" + name + "\",\"real_time\":" + std::to_string(time) + more + "}";
}

Outcome<std::vector<TraceDurations>> read(const std::string& text) {
    const testing::TempTree tree;
    return readTraceResults(tree.write("results", text));
}

std::vector<TraceDurations> of(const std::string& entries) {
    const auto read =
        reading::read("{\"context\":{\"name\":\"HYReporting\"},\"benchmarks\":[" + entries + "]}");
    EXPECT_TRUE(read.ok());
    return read.ok() ? read.value() : std::vector<TraceDurations>();
}

TEST(TraceResultsTest, ValuesOfANameAreSummedUp) {
    std::string entries;
    for (int i = 100; i >= 1; --i) {
        entries += entry("decode", i, ",\"time_unit\":\"ns\"") + ",";
    }
    const auto all = of(entries + entry("mix", 7));
    ASSERT_EQ(all.size(), 2U);
    EXPECT_EQ(all[0].name, "decode");
    EXPECT_EQ(all[0].count, 100U);
    EXPECT_EQ(all[0].min, 1);
    EXPECT_EQ(all[0].median, 50.5);
    EXPECT_EQ(all[0].p90, 90);
    EXPECT_EQ(all[0].p99, 99);
    EXPECT_EQ(all[0].max, 100);
    EXPECT_EQ(all[0].total, 5050);
    EXPECT_EQ(all[1].median, 7);
    EXPECT_EQ(all[1].p99, 7);
}

TEST(TraceResultsTest, OtherUnitsBecomeNanoseconds) {
    const auto all =
        of(entry("a", 2, ",\"time_unit\":\"us\"") + "," + entry("b", 2, ",\"time_unit\":\"s\""));
    EXPECT_EQ(all[0].total, 2000);
    EXPECT_EQ(all[1].total, 2e9);
}

TEST(TraceResultsTest, EntriesThatAreNoMeasuredValueDoNotCount) {
    EXPECT_TRUE(of("{\"name\":\"a\"},{\"real_time\":1},7,[{\"name\":\"b\",\"real_time\":1}]," +
                   entry("c", 1, ",\"run_type\":\"aggregate\""))
                    .empty());
    // What lies deeper in an entry is not the entry's.
    EXPECT_EQ(of(entry("d", 1, ",\"more\":{\"name\":\"e\",\"real_time\":5}"))[0].total, 1);
}

TEST(TraceResultsTest, WhatIsNoResultsFileIsSaidToBeNone) {
    for (const char* const text : {"", "{}", "[]", "{\"benchmarks\":{}}", "{\"benchmarks\":[",
                                   "{\"x\":{\"benchmarks\":[]}}", "nonsense"}) {
        const auto results = read(text);
        ASSERT_FALSE(results.ok()) << text;
        EXPECT_EQ(results.failure().exit, Exit::Failed);
    }
    EXPECT_FALSE(readTraceResults(std::filesystem::path("/nonexistent")).ok());
}

TEST(TraceResultsTest, DepthCostsNoStack) {
    EXPECT_FALSE(read(std::string(1'000'000, '[')).ok());
}

} // namespace
} // namespace halyard::reading
