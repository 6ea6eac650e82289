// What a session leaves when it stops.

#include <gtest/gtest.h>

#include "platform/HYReportingUtilityDevice.h"
#include "session/SessionFixture.h"
#include "session/SummaryFile.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class SessionStopTest : public SessionTest {
protected:
    static void sendVolume(HYReportingSession& session, double volume, bool playing, double time) {
        session.sendMessage(Dictionary{{"VQSessionVolume", volume},
                                       {"VQSessionVolumePlayingState", playing},
                                       {"hyreporting_timestamp", time}},
                            kAudioEventCategoryVolume, kAudioEventTypeSetup, nullptr);
    }
    // A session that played for ten seconds.
    std::shared_ptr<HYReportingSession> playedSession() {
        auto session = makeRelayedSession();
        session->start();
        sendVolume(*session, 0.5, true, 10);
        sendVolume(*session, 0.5, false, 20);
        return session;
    }
};

TEST_F(SessionStopTest, VolumeEventsThenFileThenSummaryThenClosing) {
    const auto session = playedSession();
    session->stop();
    run();

    const auto& messages = upload().messages;
    ASSERT_THAT(messages, SizeIs(4));
    EXPECT_EQ(messages[2].category, 14);
    EXPECT_EQ(messages[2].type, 11u);
    EXPECT_EQ(messages[2].payload["play_seconds"], Value(10));
    EXPECT_EQ(messages[3].category, 0xFFFF);
    EXPECT_EQ(messages[3].type, 65535u);
    EXPECT_TRUE(messages[3].payload.contains("HY_Session_Summary_Event"));
    EXPECT_TRUE(upload().closed);

    std::vector<std::string> order;
    for (const auto& line : platform_.log.texts(LogLevel::Info)) {
        if (line.starts_with("sending ") || line.starts_with("jsonOutput")) {
            order.push_back(line);
        }
    }
    EXPECT_THAT(order, ElementsAre("sending volume event for reporter 7",
                                   HasSubstr("jsonOutput writeToURL: "),
                                   "sending summary event for reporter 7"));
}

TEST_F(SessionStopTest, StretchesOfHalfASecondAreTooShortForAnEvent) {
    for (const auto& [end, events] : {std::pair(10.5, 0U), std::pair(10.75, 1U)}) {
        const auto session = makeSession();
        session->start();
        sendVolume(*session, 0.5, true, 10);
        sendVolume(*session, 0.5, false, end);
        EXPECT_THAT(session->createVolumeMessages(), SizeIs(events));
    }
}

TEST_F(SessionStopTest, VolumeEventsGoToTheSessionBeforeTheyGoToAnalytics) {
    const auto session = playedSession();
    platform_.logMarksAndQuestions();
    platform_.log.clear();
    session->stop();

    auto texts = platform_.log.texts();
    texts.resize(8);
    EXPECT_THAT(texts, ElementsAre("ending session 7", "ending session 7", "mark 21044830",
                                   "sending volume event for reporter 7",
                                   "sending message for session owned by 7", "mark 21044838",
                                   "asked com.kestrel.halyard.Volume.Summary",
                                   "asked com.kestrel.longformaudio.Volume.Summary"));
}

TEST_F(SessionStopTest, VolumeEventsGoToAnalyticsToo) {
    platform_.analytics.usesAll = true;
    const auto session = playedSession();
    session->stop();

    ASSERT_THAT(platform_.analytics.events, SizeIs(2));
    EXPECT_EQ(platform_.analytics.events[0].name, "com.kestrel.halyard.Volume.Summary");
}

TEST_F(SessionStopTest, TheFileHoldsTheBatchWithItsVolumeEvents) {
    const auto session = playedSession();
    session->stop();

    ASSERT_THAT(platform_.files.files, SizeIs(1));
    const auto& [path, text] = *platform_.files.files.begin();
    EXPECT_THAT(path, HasSubstr(HYReportingLogsDirectory));
    EXPECT_THAT(path, HasSubstr("-halyard-Unknown-longformaudio.json"));
    EXPECT_THAT(text, HasSubstr("\"Volume_Setup_2\""));
    EXPECT_THAT(text, HasSubstr("\"Volume_Summary_1\""));
    EXPECT_EQ(platform_.files.directories.at(0).mode, 0777u);
}

TEST_F(SessionStopTest, TheFileIsNamedAfterTheTimeTheApplicationAndTheService) {
    platform_.clock.offset = std::chrono::hours(2);
    const auto session = playedSession();
    session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", "mpv"}});
    session->stop();

    ASSERT_THAT(platform_.files.files, SizeIs(1));
    EXPECT_EQ(platform_.files.files.begin()->first,
              std::string(HYReportingLogsDirectory) +
                  "/20231115-001320+0200-halyard-mpv-longformaudio.json");
    EXPECT_EQ(platform_.files.directories.at(0).path, HYReportingLogsDirectory);
}

TEST_F(SessionStopTest, TheLogNamesTheFileThatWasWritten) {
    platform_.files.place = "/var/log";
    const auto session = playedSession();
    session->stop();

    EXPECT_TRUE(logged(LogLevel::Info,
                       "jsonOutput writeToURL: /var/log" + platform_.files.files.begin()->first));
}

TEST_F(SessionStopTest, AFileThatCannotBeWrittenIsToldAndTheSummaryStillGoes) {
    platform_.files.place = "/var/log";
    platform_.files.createError = Error{"posix", 13, "Permission denied"};
    platform_.files.writeError = Error{"posix", 28, "No space left on device"};
    const auto session = playedSession();
    session->stop();
    run();

    EXPECT_TRUE(logged(LogLevel::Error, std::string("can't create logging directory at /var/log") +
                                            HYReportingLogsDirectory + ": Permission denied"));
    EXPECT_TRUE(logged(LogLevel::Error, "jsonOutput writeToURL: No space left on device"));
    EXPECT_THAT(upload().messages, SizeIs(4));
}

TEST_F(SessionStopTest, OnlyInternalBuildsWriteAFile) {
    platform_.deviceProperties.booleans["InternalBuild"] = false;
    const auto session = playedSession();
    EXPECT_THAT(session->nestedAggregatedPayloadData(), IsEmpty()) << "nobody will read them";
    session->stop();

    EXPECT_THAT(platform_.files.files, IsEmpty());
    EXPECT_THAT(platform_.files.directories, IsEmpty());
    EXPECT_EQ(platform_.log.count("sending summary event for reporter 7"), 1U);
}

TEST_F(SessionStopTest, AnEmptyBatchLeavesNothing) {
    const auto session = makeRelayedSession();
    session->start();
    session->stop();
    run();

    EXPECT_THAT(upload().messages, IsEmpty());
    EXPECT_THAT(platform_.files.files, IsEmpty());
}

} // namespace
} // namespace halyard
