#include "drivers/HYReportingDriverUtility.h"

#include "drivers/DriverFixture.h"

namespace halyard {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Pair;

class HYReportingDriverUtilityTest : public DriverTest {
protected:
    HYReportingDriverUtilityTest() {
        group("Speaker-(null)") = {};
        group("Rx-(null)") = {};
    }

    // Drops what the construction logged and called.
    HYReportingDriverUtility& utility() {
        if (!utility_) {
            utility_.emplace();
            platform_.log.clear();
            platform_.hwReport.calls.clear();
        }
        return *utility_;
    }
    std::shared_ptr<HYReportingSession> startedSession() {
        auto session = HYReportingSession::initWithID(7, {100});
        session->start();
        platform_.log.clear();
        return session;
    }
    std::shared_ptr<HYReportingSession> sessionWithSnapshot() {
        auto session = startedSession();
        session->setDriverSnapShot(utility().getSnapShot());
        platform_.log.clear();
        platform_.hwReport.calls.clear();
        return session;
    }
    Lines driverLines() const {
        Lines result;
        for (const auto& each : platform_.log.lines()) {
            if (each.category == HYReportingDriverUtilityCategory) {
                result.push_back(each);
            }
        }
        return result;
    }
    // The batched messages without their tag, by identifier.
    static std::vector<std::pair<std::string, Dictionary>>
    messages(const HYReportingSession& session) {
        std::vector<std::pair<std::string, Dictionary>> result;
        for (auto& [identifier, message] : session.nestedAggregatedPayloadData()) {
            Dictionary plain = message;
            plain.erase("audiotag");
            result.emplace_back(identifier, plain);
        }
        return result;
    }

private:
    std::optional<HYReportingDriverUtility> utility_;
};

TEST_F(HYReportingDriverUtilityTest, SnapshotsEveryDriverUnderItsDescription) {
    const auto snapshot = utility().getSnapShot();
    ASSERT_EQ(snapshot->size(), 2U);
    EXPECT_NE(snapshot->at("Speaker-(null)"), nullptr);
    EXPECT_NE(snapshot->at("Rx-(null)"), nullptr);
    EXPECT_THAT(platform_.hwReport.calls, ElementsAre("sample Speaker-(null)", "sample Rx-(null)"));
    EXPECT_EQ(platform_.log.lines(), (Lines{line(LogLevel::Info, "sampling driver Speaker-(null)"),
                                            line(LogLevel::Info, "sampling driver Rx-(null)")}));
}

TEST_F(HYReportingDriverUtilityTest, ADriverThatCannotBeSampledIsNotInTheSnapshot) {
    group("Speaker-(null)") = {.sampled = false, .samplingError = -536870212};
    const auto snapshot = utility().getSnapShot();
    EXPECT_EQ(snapshot->count("Speaker-(null)"), 0U);
    EXPECT_EQ(snapshot->count("Rx-(null)"), 1U);
    EXPECT_EQ(platform_.log.lines()[1],
              line(LogLevel::Error, "HWReportCreateSamples error -536870212"));
}

TEST_F(HYReportingDriverUtilityTest, ASnapshotWithoutSamplesAndErrorsLogsNoError) {
    group("Speaker-(null)").sampled = false;
    group("Rx-(null)").samplingError = 3; // Beside samples, it tells nothing.
    EXPECT_EQ(utility().getSnapShot()->size(), 1U);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error), IsEmpty());
}

TEST_F(HYReportingDriverUtilityTest, ASubscriptionThatFailedOnlyFailsToBeSampled) {
    group("Speaker-(null)").handle = false;
    EXPECT_EQ(utility().getSnapShot()->size(), 1U);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre("HWReportCreateSamples error 22"));
}

TEST_F(HYReportingDriverUtilityTest, WithoutASnapshotNothingIsSentButAllIsSampled) {
    group("Speaker-(null)").delta = {simple("Underruns", 3)};
    const auto session = startedSession();
    utility().sendDriverLogsForSession(session);
    EXPECT_THAT(messages(*session), IsEmpty());
    EXPECT_THAT(platform_.hwReport.calls, ElementsAre("sample Speaker-(null)", "sample Rx-(null)"));
    EXPECT_EQ(driverLines(), (Lines{line(LogLevel::Info, "getting latest samples"),
                                    line(LogLevel::Info, "done getting latest samples"),
                                    line(LogLevel::Info, "getting latest samples"),
                                    line(LogLevel::Info, "done getting latest samples")}));
}

TEST_F(HYReportingDriverUtilityTest, SendsTheKindsInOrderAndThoseThatHoldSomething) {
    Channel twoBuckets = histogram({{0, 10, 5}});
    group("Speaker-(null)").delta = {states({{"on", 1, 2, 0.5}}), twoBuckets};
    group("Rx-(null)").delta = {simple("Underruns", 3), simple("Drops", 4)};
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_THAT(
        messages(*session),
        ElementsAre(Pair("HWReporting_Simple_1",
                         Dictionary{{"Speaker_Simple_Underruns", 3}, {"Speaker_Simple_Drops", 4}}),
                    Pair("HWReporting_Histogram_1",
                         Dictionary{{"Speaker_Histogram_Latency",
                                     "count=1,lower=0,upper=10,min=0,max=0,unit=ms::0-10:5"}}),
                    Pair("HWReporting_State_1",
                         Dictionary{{"Speaker_State_Power",
                                     "name:on,transition:1,residency:2,duty_cycle:0.500000;"}})));
}

TEST_F(HYReportingDriverUtilityTest, SendsNoMessageForAKindWithoutKeys) {
    group("Speaker-(null)").delta = {simple("Zero", 0), histogram({{0, 10, 0}})};
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_THAT(messages(*session), IsEmpty());
    EXPECT_THAT(platform_.analytics.asked, IsEmpty());
}

TEST_F(HYReportingDriverUtilityTest, EachMessageAlsoGoesToAnalytics) {
    platform_.analytics.usesAll = true;
    group("Speaker-(null)").delta = {simple("Underruns", 3), states({})};
    const auto session = sessionWithSnapshot();
    session->setServiceType(kAudioServiceTypeAlarms);
    utility().sendDriverLogsForSession(session);
    ASSERT_EQ(platform_.analytics.events.size(), 4U);
    EXPECT_EQ(platform_.analytics.events[0].name, "com.kestrel.halyard.HWReporting.Simple");
    EXPECT_EQ(platform_.analytics.events[0].builder()["Speaker_Simple_Underruns"], Value(3));
    EXPECT_EQ(platform_.analytics.events[2].name, "com.kestrel.halyard.HWReporting.State");
    platform_.analytics.events.clear(); // They hold the session.
}

TEST_F(HYReportingDriverUtilityTest, EachMessageGoesToTheSessionBeforeItGoesToAnalytics) {
    group("Speaker-(null)").delta = {simple("Underruns", 3), states({})};
    const auto session = sessionWithSnapshot();
    platform_.logMarksAndQuestions();
    platform_.log.clear();
    utility().sendDriverLogsForSession(session);
    std::vector<std::string> order;
    for (const std::string& text : platform_.log.texts()) {
        if (text == "mark 21044838" || text.starts_with("asked com.kestrel.halyard.")) {
            order.push_back(text);
        }
    }
    EXPECT_THAT(order, ElementsAre("mark 21044838", "asked com.kestrel.halyard.HWReporting.Simple",
                                   "mark 21044838", "asked com.kestrel.halyard.HWReporting.State"));
}

TEST_F(HYReportingDriverUtilityTest, ReportsTheChangeSinceTheSnapshotEveryTime) {
    const auto session = sessionWithSnapshot();
    const auto snapshot = session->driverSnapShot();
    utility().sendDriverLogsForSession(session);
    utility().sendDriverLogsForSession(session);
    EXPECT_EQ(session->driverSnapShot(), snapshot);
    EXPECT_THAT(platform_.hwReport.calls,
                ElementsAre("sample Speaker-(null)", "delta Speaker-(null) 1 3", "sample Rx-(null)",
                            "delta Rx-(null) 2 4", "sample Speaker-(null)",
                            "delta Speaker-(null) 1 5", "sample Rx-(null)", "delta Rx-(null) 2 6"));
}

TEST_F(HYReportingDriverUtilityTest, ADriverMissingInTheSnapshotHasNoPreviousSet) {
    group("Speaker-(null)").sampled = false;
    const auto session = sessionWithSnapshot();
    group("Speaker-(null)") = {.delta = {simple("Underruns", 3)}};
    utility().sendDriverLogsForSession(session);
    EXPECT_EQ(platform_.hwReport.calls.at(1), "delta Speaker-(null) none 3");
    EXPECT_EQ(messages(*session).size(), 1U);
}

TEST_F(HYReportingDriverUtilityTest, ADriverThatCannotBeSampledIsSkipped) {
    group("Rx-(null)").delta = {simple("Underruns", 3)};
    const auto session = sessionWithSnapshot();
    group("Speaker-(null)") = {.sampled = false, .samplingError = 5};
    utility().sendDriverLogsForSession(session);
    EXPECT_EQ(driverLines()[2], line(LogLevel::Error, "HWReportCreateSamples error 5"));
    EXPECT_EQ(messages(*session).size(), 1U);
}

TEST_F(HYReportingDriverUtilityTest, AFailedDeltaReadsLikeFailedSamples) {
    group("Speaker-(null)") = {.differs = false, .deltaError = 7};
    group("Rx-(null)").differs = false;
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error), ElementsAre("HWReportCreateSamples error 7"));
    EXPECT_THAT(messages(*session), IsEmpty());
}

TEST_F(HYReportingDriverUtilityTest, OnlyTheSnapshotsSetsOutliveAReport) {
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_EQ(platform_.hwReport.setsAlive(), 2U);
    session->setDriverSnapShot(nullptr);
    EXPECT_EQ(platform_.hwReport.setsAlive(), 0U);
}

TEST_F(HYReportingDriverUtilityTest, DropsTheFormatsThatNobodyReads) {
    Channel zero = simple("A", 1);
    zero.format = 0;
    Channel four = simple("B", 1);
    four.format = 4;
    four.group.reset();
    four.subGroup = "QLX";
    group("Speaker-(null)").delta = {zero, four};
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_EQ(
        driverLines()[2],
        line(LogLevel::Debug, "Dropping sample of type : 0 for group : Speaker subgroup : (null)"));
    EXPECT_EQ(
        driverLines()[3],
        line(LogLevel::Debug, "Dropping sample of type : 4 for group : (null) subgroup : QLX"));
    EXPECT_THAT(messages(*session), IsEmpty());
}

TEST_F(HYReportingDriverUtilityTest, FormatsFromFiveOnAreErrors) {
    Channel five = simple("A", 1);
    five.format = 5;
    Channel most = simple("B", 1);
    most.format = 255;
    group("Speaker-(null)").delta = {five, most, simple("C", 1)};
    const auto session = sessionWithSnapshot();
    utility().sendDriverLogsForSession(session);
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre("The HWReportingFormat 5 is not supported group : Speaker subgroup : "
                            "(null)",
                            "The HWReportingFormat 255 is not supported group : Speaker subgroup "
                            ": (null)"));
    EXPECT_THAT(messages(*session),
                ElementsAre(Pair("HWReporting_Simple_1", Dictionary{{"Speaker_Simple_C", 1}})));
}

} // namespace
} // namespace halyard
