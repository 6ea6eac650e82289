// In which order the four sinks and the sessions see a message. Readers of the
// store rely on it: a session comes last when it is addressed and first in a
// broadcast.

#include "service/ServiceFixture.h"

#include <algorithm>
#include <limits>

namespace halyard {
namespace {

using protocol::ReporterIDs;
using ::testing::ElementsAre;

class SinkOrderTest : public ServiceTest {
protected:
    SinkOrderTest() : ServiceTest(true) { platform_.logMarksAndQuestions(); }

    // Who saw the message, in that order.
    std::vector<std::string> seenBy(std::uint16_t type, Dictionary message,
                                    std::optional<ReporterIDs> ids) {
        platform_.log.clear();
        client_.ask(protocol::Method::SendMessage, {.dictionary = std::move(message),
                                                    .category = kAudioEventCategoryPlayback,
                                                    .type = type,
                                                    .reporterIDs = std::move(ids)});
        std::vector<std::string> seen;
        for (const std::string& text : platform_.log.texts()) {
            const auto trace =
                std::find_if(std::begin(kTraces), std::end(kTraces),
                             [&](const Trace& each) { return text.starts_with(each.text); });
            if (trace != std::end(kTraces)) {
                seen.emplace_back(trace->who);
            }
        }
        return seen;
    }
    // Analytics, the ledger and issue capture take it. Not a number equals
    // nothing, so no report repeats another.
    std::vector<std::string> seenByOfHaptics(std::optional<ReporterIDs> ids) {
        return seenBy(
            kAudioEventTypeEnergyLedger,
            {{"EngineOnTime", 1},
             {"Haptic_Active_Hardware_Time_Seconds", std::numeric_limits<double>::quiet_NaN()}},
            std::move(ids));
    }
    // Analytics and the metric service take it.
    std::vector<std::string> seenByOfIssue(std::optional<ReporterIDs> ids) {
        return seenBy(kAudioEventTypeIssueDetector, {}, std::move(ids));
    }

    // What each leaves in the log.
    struct Trace {
        std::string_view text;
        const char* who;
    };
    static constexpr Trace kTraces[] = {
        {"asked com.kestrel.halyard.", "analytics"},
        {"failed to get HYReporting timestamp for energyledger", "ledger"},
        {"Failed to get issue_type for AudioIssueDetected", "metrics"},
        {"Incrementing IBX counter. player", "capture"},
        {"Getting snapshot with Incident Reporter", "capture"},
        {"sending message for session owned by 7", "session 7"},
        {"sending message for session owned by 8", "session 8"},
        {"no active reporting sessions found", "nobody else"},
        {"sending single message after delta 0 for service 5", "single message"}};

    const Peer client_ = connect(100);
};

TEST_F(SinkOrderTest, AnAddressedSessionComesAfterTheSinks) {
    client_.createAndStart(7);
    EXPECT_THAT(seenByOfHaptics(ReporterIDs{7}),
                ElementsAre("analytics", "ledger", "capture", "session 7"));
    EXPECT_THAT(seenByOfIssue(ReporterIDs{7}), ElementsAre("analytics", "metrics", "session 7"));
}

TEST_F(SinkOrderTest, AddressedSessionsAreServedOneAfterAnother) {
    client_.createAndStart(7);
    client_.createAndStart(8);
    EXPECT_THAT(seenByOfHaptics(ReporterIDs{8, 7}),
                ElementsAre("analytics", "ledger", "capture", "session 8", "analytics", "ledger",
                            "capture", "session 7"));
    EXPECT_THAT(seenByOfIssue(ReporterIDs{8, 7}), ElementsAre("analytics", "metrics", "session 8",
                                                              "analytics", "metrics", "session 7"));
}

TEST_F(SinkOrderTest, InABroadcastEachSessionComesBeforeTheSinks) {
    client_.createAndStart(7);
    client_.createAndStart(8);
    EXPECT_THAT(seenByOfHaptics(std::nullopt),
                ElementsAre("session 7", "analytics", "ledger", "capture", "session 8", "analytics",
                            "ledger", "capture"));
    EXPECT_THAT(seenByOfIssue(std::nullopt), ElementsAre("session 7", "analytics", "metrics",
                                                         "session 8", "analytics", "metrics"));
}

TEST_F(SinkOrderTest, AStandaloneMessageReachesTheSinksBeforeItLeaves) {
    EXPECT_THAT(seenByOfHaptics(std::nullopt),
                ElementsAre("analytics", "ledger", "capture", "nobody else", "single message"));
    EXPECT_THAT(seenByOfIssue(std::nullopt),
                ElementsAre("analytics", "metrics", "nobody else", "single message"));
}

} // namespace
} // namespace halyard
