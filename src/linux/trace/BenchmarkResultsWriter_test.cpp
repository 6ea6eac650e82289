#include "linux/trace/BenchmarkResultsWriter.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <set>

#include "testing/TempTree.h"
#include "testing/TestPlatform.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

using ::testing::ElementsAre;

class BenchmarkResultsWriterTest : public ::testing::Test {
protected:
    std::unique_ptr<platform::ResultsWriter> open() {
        return files_.open((tree_ / "tracing_results.pbj").string(), "HYReporting", 4);
    }
    rapidjson::Document read(std::string_view name) const {
        std::ifstream file(tree_ / name, std::ios::binary);
        rapidjson::Document document;
        document.Parse(std::string(std::istreambuf_iterator<char>(file), {}).c_str());
        EXPECT_FALSE(document.HasParseError()) << name;
        return document;
    }
    // Those of a time line, without the name of its process.
    static std::vector<const rapidjson::Value*> events(const rapidjson::Document& document) {
        std::vector<const rapidjson::Value*> result;
        for (const auto& event : document["traceEvents"].GetArray()) {
            if (event["ph"] != "M") {
                result.push_back(&event);
            }
        }
        return result;
    }

    halyard::testing::TestPlatform platform_;
    halyard::testing::TempTree tree_;
    BenchmarkResultsFiles files_{Directories{"/c", "/s", "/r", tree_.path()}, platform_.clock};
};

TEST_F(BenchmarkResultsWriterTest, TheContextNamesWriterAndVersion) {
    open()->close();
    const auto document = read("tracing_results.pbj");
    const auto& context = document["context"];
    EXPECT_STREQ(context["name"].GetString(), "HYReporting");
    EXPECT_EQ(context["version"].GetUint(), 4U);
    for (const char* const key : {"date", "host_name", "executable", "num_cpus", "load_avg"}) {
        EXPECT_TRUE(context.HasMember(key)) << key;
    }
    EXPECT_TRUE(document["benchmarks"].Empty());
}

TEST_F(BenchmarkResultsWriterTest, EachValueIsAnEntry) {
    const auto writer = open();
    writer->newValue("render", platform::ResultsUnit::Nanoseconds, 1234567);
    writer->newValue("I/O \"\xFF\"", platform::ResultsUnit::Nanoseconds, 18446744073709551615.0);
    writer->close();
    const auto document = read("tracing_results.pbj");
    const auto& entries = document["benchmarks"];
    ASSERT_EQ(entries.Size(), 2U);
    EXPECT_STREQ(entries[0]["name"].GetString(), "render");
    EXPECT_EQ(entries[0]["real_time"].GetDouble(), 1234567.0);
    EXPECT_EQ(entries[0]["cpu_time"].GetDouble(), 1234567.0);
    EXPECT_STREQ(entries[0]["time_unit"].GetString(), "ns");
    EXPECT_EQ(entries[0]["iterations"].GetUint(), 1U);
    EXPECT_STREQ(entries[1]["name"].GetString(), "I/O \"\xEF\xBF\xBD\"");
}

TEST_F(BenchmarkResultsWriterTest, AnUnfinishedFileIsNotSeen) {
    tree_.write("tracing_results.pbj", "old");
    open()->newValue("render", platform::ResultsUnit::Nanoseconds, 1);
    std::ifstream file(tree_ / "tracing_results.pbj");
    std::string text;
    file >> text;
    EXPECT_EQ(text, "old");
    EXPECT_EQ(std::distance(fs::directory_iterator(tree_.path()), {}), 1);
}

TEST_F(BenchmarkResultsWriterTest, WithoutItsDirectoryThereIsNoWriter) {
    EXPECT_EQ(files_.open((tree_ / "none/results").string(), "x", 1), nullptr);
}

TEST_F(BenchmarkResultsWriterTest, ThePathOfTheServiceIsMapped) {
    fs::create_directory(tree_ / "Traces");
    files_
        .open("/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio/Traces/results.pbj",
              "HYReporting", 4)
        ->close();
    EXPECT_TRUE(fs::exists(tree_ / "Traces/results.pbj"));
    EXPECT_TRUE(fs::exists(tree_ / "Traces/results.trace.json"));
}

platform::TraceTimeline timeline() {
    using Span = platform::TraceTimeline::Span;
    return {"audio",
            "CLOCK_MONOTONIC",
            3,
            {{"render",
              {Span{1'000'001, 3'000'999, 7, 70, true, true},
               Span{2'000'000, 4'000'000, 8, 70, true, true},
               Span{5'000'000, 0, 7, 70, true, false}, Span{0, 6'000'000, 7, 70, false, true}}}}};
}

TEST_F(BenchmarkResultsWriterTest, EveryPairHasItsOwnIdOnTheTrackOfItsItem) {
    const auto writer = open();
    writer->newTimeline(timeline());
    writer->newTimeline(timeline());
    writer->close();
    const auto document = read("tracing_results.trace.json");
    std::map<std::string, std::vector<std::string>> phases; // by id
    for (const auto* const event : events(document)) {
        phases[(*event)["id"].GetString()].emplace_back((*event)["ph"].GetString());
    }
    EXPECT_EQ(phases.size(), 8U);
    EXPECT_THAT(phases["0x1"], ElementsAre("b", "e"));
    EXPECT_THAT(phases["0x2"], ElementsAre("b", "e"));
    EXPECT_THAT(phases["0x3"], ElementsAre("n"));
    const auto& begin = *events(document)[0];
    EXPECT_STREQ(begin["name"].GetString(), "render");
    EXPECT_EQ(begin["ts"].GetDouble(), 1000.001);
    EXPECT_EQ(begin["args"]["tid"].GetUint(), 7U);
    EXPECT_EQ(begin["args"]["pid"].GetUint(), 70U);
}

TEST_F(BenchmarkResultsWriterTest, UnpairedEventsAndLossesAreVisible) {
    const auto writer = open();
    writer->newTimeline(timeline());
    writer->close();
    const auto document = read("tracing_results.trace.json");
    std::set<std::string> names;
    for (const auto* const event : events(document)) {
        names.insert((*event)["name"].GetString());
    }
    EXPECT_THAT(names,
                ElementsAre("render", "render: start without stop", "render: stop without start"));
    const auto& trace = document["otherData"]["traces"][0];
    EXPECT_STREQ(trace["name"].GetString(), "audio");
    EXPECT_STREQ(trace["clock"].GetString(), "CLOCK_MONOTONIC");
    EXPECT_EQ(trace["eventsLost"].GetUint(), 3U);
    EXPECT_EQ(trace["pairs"].GetUint(), 2U);
    EXPECT_EQ(trace["startsWithoutStop"].GetUint(), 1U);
    EXPECT_EQ(trace["stopsWithoutStart"].GetUint(), 1U);
}

} // namespace
} // namespace halyard::linux_
