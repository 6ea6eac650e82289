#include "report/DigestGathering.h"

#include <gtest/gtest.h>
#include <rapidjson/document.h>

#include "reading/TestStoreTesting.h"
#include "report/DigestJson.h"
#include "report/ReportPage.h"

namespace halyard::ctl {
namespace {

constexpr double kStart = 1'795'000'000;

std::string memory(const std::function<void(std::FILE*)>& write) {
    char* text = nullptr;
    std::size_t size = 0;
    std::FILE* const stream = ::open_memstream(&text, &size);
    write(stream);
    (void)std::fclose(stream);
    std::string result(text, size);
    std::free(text);
    return result;
}

class ReportDigestTest : public ::testing::Test {
protected:
    std::int64_t addSession(const std::string& application, double from, std::optional<double> to,
                            const std::string& direction = "playback") {
        return store_.addSession(application, kStart + from,
                                 to ? std::optional(kStart + *to) : std::nullopt,
                                 ",\"stream_direction\":\"" + direction + "\"");
    }
    void addVolume(std::int64_t session, double at, int state, double volume) {
        add(session, 14, 3, at,
            "\"VQSessionVolumePlayingState\":" + std::to_string(state) +
                ",\"VQSessionVolume\":" + std::to_string(volume));
    }
    void addGlitch(std::int64_t session, double at, double seconds, const std::string& cause,
                   const std::string& more = "") {
        add(session, 4, 7, at,
            "\"glitch_start\":" + std::to_string(kStart + at) +
                ",\"any_channel_silence_seconds\":" + std::to_string(seconds) +
                ",\"issue_type\":\"" + cause + "\"" + more);
    }
    void add(std::int64_t session, int category, int type, double at, const std::string& entries) {
        store_.addMessage(session, category, type, "{" + entries + "}", kStart + at);
    }

    Digest& gather() {
        digest_.emplace(limits_);
        digest_->scope = scope_;
        store_.close();
        auto reader = store_.open();
        const auto gathered = gatherDigest(reader, *digest_, limits_, [](double) {});
        EXPECT_TRUE(gathered.ok());
        return *digest_;
    }
    rapidjson::Document json(RowForm form) {
        gather();
        rapidjson::Document document;
        document.Parse(memory([&](std::FILE* to) {
                           JsonStream stream(to);
                           stream.beginDocument();
                           writeDigest(stream, *digest_, form);
                       }).c_str());
        EXPECT_FALSE(document.HasParseError());
        return document;
    }
    std::string page() {
        gather();
        return memory([&](std::FILE* to) {
            EXPECT_TRUE(writePage(
                to, [&](JsonStream& stream) { writeDigest(stream, *digest_, RowForm::Packed); }));
        });
    }

    reading::TestStore store_;
    ReportScope scope_{kStart + 1000, {}, {}};
    Digest::Limits limits_;
    std::optional<Digest> digest_;
};

TEST_F(ReportDigestTest, SumsUpWhatPlayedAndCaptured) {
    const auto music = addSession("music", 0, 100);
    const auto call = addSession("call", 0, 100, "capture");
    addVolume(music, 10, 1, 0.5);
    addVolume(call, 20, 1, 1);
    addVolume(music, 40, 0, 0.5);
    addVolume(call, 25, 0, 1);

    const Digest& digest = gather();

    EXPECT_DOUBLE_EQ(digest.playedSeconds, 30);
    EXPECT_DOUBLE_EQ(digest.capturedSeconds, 5);
    ASSERT_EQ(digest.applications.size(), 2U);
    EXPECT_EQ(digest.applications[0].name, "music");
    EXPECT_DOUBLE_EQ(digest.applications[0].playedSeconds, 30);
    EXPECT_DOUBLE_EQ(digest.applications[1].capturedSeconds, 5);
}

TEST_F(ReportDigestTest, AChangeOfVolumeBeginsAnotherStretch) {
    const auto music = addSession("music", 0, 100);
    addVolume(music, 10, 1, 0.5);
    addVolume(music, 20, 1, 0.25);
    addVolume(music, 50, 0, 0.25);

    const auto& stretches = gather().stretches.entries();

    ASSERT_EQ(stretches.size(), 2U);
    EXPECT_DOUBLE_EQ(stretches[0].from, kStart + 10);
    EXPECT_DOUBLE_EQ(stretches[0].to, kStart + 20);
    EXPECT_EQ(stretches[0].volume, 0.5);
    EXPECT_DOUBLE_EQ(stretches[1].to, kStart + 50);
    EXPECT_EQ(stretches[1].volume, 0.25);
}

TEST_F(ReportDigestTest, AStretchEndsWithItsSession) {
    addVolume(addSession("music", 0, 100), 90, 1, 1);

    EXPECT_DOUBLE_EQ(gather().playedSeconds, 10);
}

TEST_F(ReportDigestTest, WhatLiesOutsideOfTheTimeAskedForIsCutOff) {
    const auto music = addSession("music", 0, 500);
    addVolume(music, 10, 1, 1);
    addGlitch(music, 50, 0.1, "memory");
    addGlitch(music, 150, 0.1, "memory");
    addVolume(music, 400, 0, 1);
    scope_.range = {kStart + 100, kStart + 300};

    const Digest& digest = gather();

    EXPECT_DOUBLE_EQ(digest.playedSeconds, 200);
    EXPECT_EQ(digest.glitchSum.glitches, 1U);
    EXPECT_EQ(digest.tables.front().rows.taken(), 1U);
}

TEST_F(ReportDigestTest, OnlyWantedApplicationsCount) {
    addVolume(addSession("music", 0, 100), 50, 1, 1);
    addVolume(addSession("muzak", 0, 100), 10, 1, 1);
    store_.insert("analytics_event(name, payload, time)", "'e', '{}', 1795000001");
    scope_.applicationPattern = "mus*";

    const Digest& digest = gather();

    EXPECT_EQ(digest.sessionCount, 1U);
    EXPECT_DOUBLE_EQ(digest.playedSeconds, 50);
    EXPECT_EQ(digest.tables.size(), 1U);
    EXPECT_EQ(digest.tables.front().rows.taken(), 1U);
}

TEST_F(ReportDigestTest, GlitchesAreSummedUpByAll) {
    const auto music = addSession("music", 0, 3600);
    addVolume(music, 0, 1, 1);
    addGlitch(music, 1, 0.25, "memory", ",\"glitch_device\":\"out\"");
    addGlitch(music, 2, 0.5, "memory");
    addGlitch(music, 3, 1.25, "process_stopped");

    const auto digest = json(RowForm::Plain);

    const auto& totals = digest["totals"];
    EXPECT_EQ(totals["glitches"].GetInt(), 3);
    EXPECT_DOUBLE_EQ(totals["silent_seconds"].GetDouble(), 2);
    EXPECT_DOUBLE_EQ(totals["longest_seconds"].GetDouble(), 1.25);
    EXPECT_DOUBLE_EQ(totals["glitches_per_hour"].GetDouble(), 3);
    EXPECT_STREQ(digest["by_cause"][0]["name"].GetString(), "memory");
    EXPECT_EQ(digest["by_cause"][0]["glitches"].GetInt(), 2);
    EXPECT_EQ(digest["by_device"].Size(), 2U);
    EXPECT_EQ(digest["glitches"].Size(), 3U);
}

TEST_F(ReportDigestTest, TellsTheStatisticsOfASession) {
    const auto music = addSession("music", 0, 100);
    add(music, 12, 16, 99, R"("out_Speaker_Simple_Cycles":8852,"audiotag":"x")");
    add(music, 12, 17, 99,
        R"("out_Speaker_Histogram_Wait":"count=9,lower=0,upper=9,min=1,max=7,unit=us::1-5:3;5-7:1")");
    add(music, 12, 18, 99,
        R"("c_CPUIdle_QLX_State_cpu0":"name:C1,transition:3,residency:28,duty_cycle:0.5;")");

    const auto digest = json(RowForm::Plain);

    EXPECT_EQ(digest["counters"][0]["value"].GetInt(), 8852);
    EXPECT_EQ(digest["counters"].Size(), 1U);
    EXPECT_STREQ(digest["histograms"][0]["channel"].GetString(), "Wait");
    EXPECT_EQ(digest["histograms"][0]["buckets"][1][0].GetInt(), 5);
    EXPECT_STREQ(digest["residencies"][0]["group"].GetString(), "CPUIdle_QLX");
    EXPECT_DOUBLE_EQ(digest["residencies"][0]["states"][0]["duty_cycle"].GetDouble(), 0.5);
}

TEST_F(ReportDigestTest, ListsEveryRowOfEveryTable) {
    addVolume(addSession("music", 0, 100), 50, 1, 1);
    store_.insert("analytics_event(name, payload, time)", "'event', '{\"a\":1}', 1795000001");
    store_.insert("incident(signature, report, time)", "'{\"s\":2}', 'what', 1795000002");

    const auto digest = json(RowForm::Plain);

    const auto& tables = digest["tables"];
    EXPECT_STREQ(tables["messages"]["rows"][0]["application"].GetString(), "music");
    EXPECT_EQ(tables["events"]["rows"][0]["payload"]["a"].GetInt(), 1);
    EXPECT_EQ(tables["incidents"]["total"].GetInt(), 1);
    EXPECT_EQ(tables["metrics"]["rows"].Size(), 0U);
}

TEST_F(ReportDigestTest, ListsKeepTheNewestAndSumsAreOfAll) {
    limits_.sessions = 3;
    limits_.glitches = 2;
    limits_.stretches = 4;
    limits_.applications = 2;
    for (int i = 0; i < 10; ++i) {
        const auto session = addSession("app" + std::to_string(i), i, i + 1.0);
        addVolume(session, i, 1, 1);
        addGlitch(session, i + 0.5, 0.1, "memory");
    }

    const auto digest = json(RowForm::Plain);

    EXPECT_EQ(digest["totals"]["sessions"].GetInt(), 10);
    EXPECT_NEAR(digest["totals"]["played_seconds"].GetDouble(), 10, 1e-4);
    EXPECT_EQ(digest["totals"]["glitches"].GetInt(), 10);
    EXPECT_EQ(digest["sessions"].Size(), 3U);
    EXPECT_STREQ(digest["sessions"][2]["application"].GetString(), "app9");
    EXPECT_EQ(digest["glitches"].Size(), 2U);
    EXPECT_EQ(digest["left_out"]["sessions"].GetInt(), 7);
    EXPECT_EQ(digest["left_out"]["glitches"].GetInt(), 8);
    EXPECT_EQ(digest["left_out"]["stretches"].GetInt(), 6);
    EXPECT_EQ(digest["applications"].Size(), 3U);
    EXPECT_TRUE(digest["applications"][0]["others"].GetBool());
    EXPECT_EQ(digest["applications"][0]["sessions"].GetInt(), 8);
}

TEST_F(ReportDigestTest, NamesAreCutBetweenLetters) {
    EXPECT_EQ(shortName("short"), "short");
    EXPECT_EQ(shortName(std::string(120, 'a')), std::string(120, 'a'));
    EXPECT_EQ(shortName(std::string(119, 'a') + "ü"), std::string(119, 'a') + "…");
    EXPECT_EQ(shortName(std::string(118, 'a') + "üb"), std::string(118, 'a') + "ü…");
}

TEST_F(ReportDigestTest, AHugeNameAndHugeEvidenceMakeNoHugeDigest) {
    const std::string huge(100'000, 'x');
    const auto session = addSession(huge, 0, 100);
    addVolume(session, 1, 1, 1);
    addGlitch(session, 2, 0.1, huge,
              ",\"node\":\"" + huge + "\",\"glitch_evidence\":{\"a\":\"" + huge + "\"}");

    const Digest& digest = gather();

    EXPECT_EQ(digest.sessions.entries()[0].application->size(), 123U);
    EXPECT_LT(digest.glitches.entries()[0].size(), 1000U);
    EXPECT_NE(digest.glitches.entries()[0].find("\"evidence\":null"), std::string::npos);
}

TEST_F(ReportDigestTest, NoTextOfTheStoreEndsItsPlaceInThePage) {
    const auto session = addSession("</script><img src=x onerror=alert(1)><!--", 0, 100);
    addGlitch(session, 2, 0.1, "<script>", ",\"node\":\"]]></ScRiPt>\"");

    const std::string text = page();

    const auto begin = text.find("id=\"digest\">") + 12;
    const std::string embedded = text.substr(begin, text.find("</script>", begin) - begin);
    rapidjson::Document document;
    ASSERT_FALSE(document.Parse(embedded.c_str()).HasParseError());
    EXPECT_EQ(embedded.find('<'), std::string::npos);
    EXPECT_STREQ(document["sessions"][0]["application"].GetString(),
                 "</script><img src=x onerror=alert(1)><!--");
    EXPECT_STREQ(document["glitches"][0]["node"].GetString(), "]]></ScRiPt>");
}

TEST_F(ReportDigestTest, AnEmptyStoreMakesAPage) {
    const std::string text = page();

    EXPECT_TRUE(text.starts_with("<!DOCTYPE html>"));
    EXPECT_TRUE(text.ends_with("</html>\n"));
    EXPECT_EQ(text.find("@DIGEST@"), std::string::npos);
    EXPECT_NE(text.find("\"glitches_per_hour\":null"), std::string::npos);
}

} // namespace
} // namespace halyard::ctl
