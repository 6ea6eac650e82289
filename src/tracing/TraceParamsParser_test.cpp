#include "tracing/TraceParamsParser.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>

#include "testing/TestPlatform.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class TraceParamsParserTest : public ::testing::Test {
protected:
    TraceParams load(std::string_view text) {
        platform_.files.files["/trace.plist"] = text;
        return TraceParamsParser("/trace.plist").loadTraceParams();
    }
    // Of a file of one trace that has these items.
    std::vector<TraceDataParams> loadItems(const std::string& items) {
        return load("{ Children = ({ Name = t; Children = (" + items + "); }); }").items;
    }
    TraceParams loadReal(const std::string& path) {
        std::ifstream file(path, std::ios::binary);
        return load(std::string(std::istreambuf_iterator<char>(file), {}));
    }
    std::vector<std::string> errors() const { return platform_.log.texts(LogLevel::Error); }

    halyard::testing::TestPlatform platform_;
};

class TraceParamsFormatTest : public TraceParamsParserTest,
                              public ::testing::WithParamInterface<const char*> {};

TEST(TraceParamsNamesTest, TheNamesThatFilesAreWrittenWithStay) {
    EXPECT_EQ(TraceDataTypeEvtap, "evtap");
    EXPECT_EQ(TraceDataIsCritical, "IsCritical");
    EXPECT_EQ(TracePointEventsMatchedByProcess, "Process");
}

// The same contents in three forms.
TEST_P(TraceParamsFormatTest, EveryFormOfAPropertyListReadsAlike) {
    const TraceParams params =
        loadReal(std::string(HALYARD_TRACE_DATA "/all-kinds.") + GetParam() + ".plist");
    EXPECT_EQ(params.name, "Audio path");
    EXPECT_EQ(params.isSignpost, 0);
    ASSERT_EQ(params.items.size(), 4U);
    EXPECT_EQ(params.items[0].name, "render");
    EXPECT_TRUE(params.items[0].matchByThread);
    EXPECT_EQ(params.items[0].endCode, 0x21040011U);
    EXPECT_EQ(params.items[1].name, "I/O cycle");
    EXPECT_EQ(params.items[2].type, TraceDataParams::Level);
    EXPECT_EQ(params.items[3].beginCode, 0x100U);
    EXPECT_THAT(errors(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(Forms, TraceParamsFormatTest, ::testing::Values("xml", "binary", "text"));

TEST_F(TraceParamsParserTest, TheExampleForUsersReadsWithoutComplaint) {
    const TraceParams params = loadReal(HALYARD_EXAMPLE_TRACE);
    EXPECT_EQ(params.name, "audio");
    ASSERT_EQ(params.items.size(), 2U);
    EXPECT_EQ(params.items[0].type, TraceDataParams::Interval);
    EXPECT_TRUE(params.items[0].matchByThread);
    EXPECT_FALSE(params.items[1].matchByThread);
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsParserTest, AFileWithoutChildrenYieldsAnEmptyRecord) {
    const TraceParams params = load("{ Name = x; }");
    EXPECT_EQ(params.name, "");
    EXPECT_EQ(params.isSignpost, 0);
    EXPECT_THAT(params.items, IsEmpty());
    EXPECT_TRUE(platform_.log.has(
        LogLevel::Error, HYReportingTraceCategory,
        "Failed to load Trace Parameter Array with error: line 1: the text is empty"));
}

TEST_F(TraceParamsParserTest, AMissingFileYieldsAnEmptyRecordAndSaysSoAtEachStep) {
    const TraceParams params = TraceParamsParser("/none").loadTraceParams();
    EXPECT_EQ(params.name, "");
    EXPECT_THAT(params.items, IsEmpty());
    EXPECT_THAT(
        errors(),
        ElementsAre("Reading from plist file failed with error: No such file or directory",
                    "Reading from plist file failed with error: line 1: the text is empty",
                    "No valid input found in plist.",
                    "Failed to load Trace Parameter Array with error: line 1: the text is empty"));
}

TEST_F(TraceParamsParserTest, ARelativeNameCountsFromTheCurrentDirectory) {
    platform_.files.files["/current/sub/t.plist"] = "{ Children = ({ Name = here; }); }";
    EXPECT_EQ(TraceParamsParser("sub/t.plist").loadTraceParams().name, "here");
    platform_.files.workingDirectory = "/";
    platform_.files.files["/t.plist"] = "{ Children = ({ Name = root; }); }";
    EXPECT_EQ(TraceParamsParser("t.plist").loadTraceParams().name, "root");
}

TEST_F(TraceParamsParserTest, TheFileNameCanBeChanged) {
    TraceParamsParser parser("/a");
    parser.setTraceParamsFile("/b");
    EXPECT_EQ(parser.traceParamsFile(), "/b");
}

TEST_F(TraceParamsParserTest, TwoTracesEndInOneRecordNamedAfterTheFirst) {
    const TraceParams params =
        load("{ Children = ({ Name = one; Children = ({ Name = a; Type = Impulse; }); },"
             "{ Name = two; Children = ({ Name = b; Type = Impulse; }); }); }");
    EXPECT_EQ(params.name, "one");
    ASSERT_EQ(params.items.size(), 2U);
    EXPECT_EQ(params.items[0].name, "a");
    EXPECT_EQ(params.items[1].name, "b");
}

TEST_F(TraceParamsParserTest, TheFirstNameThatIsNotEmptyCounts) {
    const TraceParams params =
        load("{ Children = ({ Children = (); }, { Name = two; Children = (); }); }");
    EXPECT_EQ(params.name, "two");
    EXPECT_THAT(errors(), ElementsAre("Description not found in the plist file"));
}

TEST_F(TraceParamsParserTest, OnceASignpostAlwaysASignpost) {
    EXPECT_EQ(load("{ Children = ({ Name = a; TraceType = OSSignpost; Children = (); },"
                   "{ TraceType = evtap; Children = (); }); }")
                  .isSignpost,
              1);
    EXPECT_EQ(
        load("{ Children = ({ Name = a; TraceType = ossignpost; Children = (); }); }").isSignpost,
        0);
}

TEST_F(TraceParamsParserTest, CodesAreHexadecimalWithAndWithoutPrefix) {
    const auto items =
        loadItems("{ Type = Interval; EvtapCodeBegin = 0x21040010; EvtapCodeEnd = 21040011; }");
    ASSERT_EQ(items.size(), 1U);
    EXPECT_EQ(items[0].beginCode, 0x21040010U);
    EXPECT_EQ(items[0].endCode, 0x21040011U);
    EXPECT_TRUE(
        platform_.log.has(LogLevel::Info, HYReportingTraceCategory,
                          "Loading tracepoint : 553910288 and 553910289 \n finished parsing."));
}

TEST_F(TraceParamsParserTest, CodesThatDoNotScanAreZero) {
    const auto items = loadItems("{ Type = Interval; EvtapCodeBegin = start; EvtapCodeEnd = 0x; },"
                                 "{ Type = Interval; EvtapCodeBegin = 100000000;"
                                 "  EvtapCodeEnd = \" 0XfFfFfFfF, the last\"; },"
                                 "{ Type = Interval; }");
    ASSERT_EQ(items.size(), 3U);
    EXPECT_EQ(items[0].beginCode, 0U);
    EXPECT_EQ(items[0].endCode, 0U);
    EXPECT_EQ(items[1].beginCode, 0U);
    EXPECT_EQ(items[1].endCode, 0xFFFFFFFFU);
    EXPECT_EQ(items[2].beginCode, 0U);
    EXPECT_TRUE(platform_.log.has(LogLevel::Info, HYReportingTraceCategory,
                                  "Loading tracepoint : 0 and -1 \n finished parsing."));
}

TEST_F(TraceParamsParserTest, OnlyBlanksMayStandBeforeACode) {
    const auto items = loadItems("{ Type = Interval; EvtapCodeBegin = \" \t\r\n12\";"
                                 "  EvtapCodeEnd = \"~12\"; },"
                                 "{ Type = Interval; EvtapCodeBegin = 0X1F; EvtapCodeEnd = x1F; }");
    ASSERT_EQ(items.size(), 2U);
    EXPECT_EQ(items[0].beginCode, 0x12U);
    EXPECT_EQ(items[0].endCode, 0U);
    EXPECT_EQ(items[1].beginCode, 0x1FU);
    EXPECT_EQ(items[1].endCode, 0U);
}

TEST_F(TraceParamsParserTest, AFileOfMoreThanAMebibyteIsNotRead) {
    std::string text = "{ Children = ({ Name = t; Children = (); }); }";
    text.resize(1024 * 1024, ' ');
    EXPECT_EQ(load(text).name, "t");
    EXPECT_EQ(load(text + ' ').name, "");
    EXPECT_EQ(errors().at(0), "Reading from plist file failed with error: File too large");
}

TEST_F(TraceParamsParserTest, IntegersAreReadByTheirDecimalDigits) {
    const TraceParams params =
        load("<plist><dict><key>Children</key><array><dict><key>Children</key><array><dict>"
             "<key>Type</key><string>Impulse</string>"
             "<key>EvtapCodeBegin</key><integer>100</integer>"
             "</dict></array></dict></array></dict></plist>");
    ASSERT_EQ(params.items.size(), 1U);
    EXPECT_EQ(params.items[0].beginCode, 256U);
}

TEST_F(TraceParamsParserTest, AnImpulseEndsWithItsOwnCode) {
    const auto items =
        loadItems("{ Type = Impulse; EvtapCodeBegin = 21040020; EvtapCodeEnd = 21040021; }");
    ASSERT_EQ(items.size(), 1U);
    EXPECT_EQ(items[0].type, TraceDataParams::Impulse);
    EXPECT_EQ(items[0].endCode, 0x21040020U);
}

TEST_F(TraceParamsParserTest, ALevelHasNoEndCode) {
    const auto items =
        loadItems("{ Type = Level; EvtapCodeBegin = 21040030; EvtapCodeEnd = 21040031; }");
    ASSERT_EQ(items.size(), 1U);
    EXPECT_EQ(items[0].type, TraceDataParams::Level);
    EXPECT_EQ(items[0].beginCode, 0x21040030U);
    EXPECT_EQ(items[0].endCode, 0U);
}

TEST_F(TraceParamsParserTest, OnlyThreadMatchesByThread) {
    const auto items = loadItems("{ Type = Interval; EventsMatchedBy = Thread; },"
                                 "{ Type = Interval; EventsMatchedBy = Process; },"
                                 "{ Type = Interval; }");
    ASSERT_EQ(items.size(), 3U);
    EXPECT_TRUE(items[0].matchByThread);
    EXPECT_FALSE(items[1].matchByThread);
    EXPECT_FALSE(items[2].matchByThread);
}

TEST_F(TraceParamsParserTest, AnUnknownTypeIsKeptWithTheTypeBeforeIt) {
    const auto items = loadItems("{ Type = Interval; EvtapCodeBegin = 1; EvtapCodeEnd = 2; },"
                                 "{ Name = odd; Type = interval; EvtapCodeBegin = 1; }");
    ASSERT_EQ(items.size(), 2U);
    EXPECT_EQ(items[1].name, "odd");
    EXPECT_EQ(items[1].type, TraceDataParams::Interval);
    EXPECT_EQ(items[1].beginCode, 0U);
    EXPECT_THAT(errors(), ElementsAre("TracePointType field not recognized or is empty."));
    EXPECT_TRUE(platform_.log.has(LogLevel::Info, HYReportingTraceCategory,
                                  "Loading tracepoint : 0 and 0 \n finished parsing."));
}

TEST_F(TraceParamsParserTest, TheTypeBeforeAnUnknownOneMayBeAny) {
    const auto items = loadItems("{ Type = Level; EvtapCodeBegin = 3; },"
                                 "{ Type = level; EvtapCodeBegin = 4; }, { Name = none; },"
                                 "{ Type = Impulse; EvtapCodeBegin = 5; }, { Type = Pulse; }");
    ASSERT_EQ(items.size(), 5U);
    EXPECT_EQ(items[1].type, TraceDataParams::Level);
    EXPECT_EQ(items[1].beginCode, 0U);
    EXPECT_EQ(items[1].endCode, 0U);
    EXPECT_EQ(items[2].type, TraceDataParams::Level);
    EXPECT_EQ(items[4].type, TraceDataParams::Impulse);
}

TEST_F(TraceParamsParserTest, AnUnknownTypeIsAnImpulseAtFirstAndAsBeforeInALaterTrace) {
    const TraceParams params =
        load("{ Children = ({ Name = t; Children = ({ EvtapCodeBegin = 1; }, { Type = Level; }); },"
             "{ Children = ({ Name = later; }); }); }");
    ASSERT_EQ(params.items.size(), 3U);
    EXPECT_EQ(params.items[0].type, TraceDataParams::Impulse);
    EXPECT_EQ(params.items[0].beginCode, 0U);
    EXPECT_EQ(params.items[0].endCode, 0U);
    EXPECT_EQ(params.items[2].type, TraceDataParams::Level);
}

TEST_F(TraceParamsParserTest, TheFilesOwnTextsAreReadAsListsAndDictionaries) {
    const TraceParams params = load("{ Children = \"({ Name = t; Children = \\\"(\\\\\\\"{ Name = "
                                    "i; Type = Level; }\\\\\\\")\\\"; })\"; }");
    EXPECT_EQ(params.name, "t");
    ASSERT_EQ(params.items.size(), 1U);
    EXPECT_EQ(params.items[0].name, "i");
}

TEST_F(TraceParamsParserTest, WhatIsMalformedIsLoggedAndPassedOver) {
    const TraceParams params = load("{ Children = (\"{\", (x), { Name = t; Children = 5; },"
                                    "{ Children = (\"{\", { Name = good; Type = Level; }); }); }");
    ASSERT_EQ(params.items.size(), 1U);
    EXPECT_EQ(params.items[0].name, "good");
    EXPECT_THAT(
        errors(),
        ElementsAre("Failed to load Trace Parameter dictionary with error : line 1: the text ends "
                    "too early",
                    "Failed to load Trace Parameter dictionary with error : a dictionary is "
                    "expected here",
                    "Failed to read the Trace Points from the plist file with error: a list is "
                    "expected here",
                    "Failed to read Trace Point from Trace Points dictionary. Failed with error: "
                    "line 1: the text ends too early"));
}

} // namespace
} // namespace halyard
