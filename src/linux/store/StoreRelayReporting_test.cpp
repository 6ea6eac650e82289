#include "linux/store/StoreRelayReporting.h"

#include "linux/store/StoreTesting.h"
#include "testing/FakeTraceMarks.h"

namespace halyard::linux_ {
namespace {

using namespace platform;

class StoreRelayReportingTest : public StoreFixture {
protected:
    StoreRelayReporting& framework() {
        framework_ = std::make_unique<StoreRelayReporting>(open(), random_);
        return *framework_;
    }
    static Dictionary sessionInfo() {
        return {{kRelayReportingSessionInfoSessionID, 4711},
                {kRelayReportingSessionInfoBatchEvent, true}};
    }
    std::optional<List> backends(RelayReporting& session) {
        std::optional<List> found;
        session.startConfigurationWithCompletionHandler(
            [&found](std::optional<List> list) { found = std::move(list); });
        return found;
    }

    testing::FakeRandom random_;
    std::unique_ptr<StoreRelayReporting> framework_;
};

TEST_F(StoreRelayReportingTest, ASessionLastsAsLongAsItsLastReference) {
    auto session = framework().initWithSessionInfo(
        sessionInfo(), {{kRelayReportingUserInfoServiceName, "alarms_session"}}, {});
    EXPECT_EQ(backends(*session), List{Value("store")});
    EXPECT_EQ(session->sendMessageWithCategory(4, 1, examplePayload()), std::nullopt);
    session->flushMessages();
    flush();
    EXPECT_EQ(reader().one("SELECT session_id, closed FROM upload_session"), "4711|NULL");
    clock_.advance(std::chrono::seconds(3));
    session.reset();
    flush();
    EXPECT_EQ(reader().one("SELECT opened, closed, user_info FROM upload_session"),
              "1700000000.0|1700000003.0|"
              "{\"kRelayReportingUserInfoServiceName\":\"alarms_session\"}");
}

TEST_F(StoreRelayReportingTest, SingleMessagesGoOutOnTheirOwn) {
    EXPECT_EQ(framework().sendOneMessageWithSessionInfo(sessionInfo(), {}, 4, 1, examplePayload()),
              std::nullopt);
    flush();
    EXPECT_EQ(reader().one("SELECT upload_session, session_info ->> '$."
                           "kRelayReportingSessionInfoSessionID' FROM upload_message"),
              "NULL|4711");
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_session"), 0);
}

TEST_F(StoreRelayReportingTest, ThereIsNoBackEndWithoutAStore) {
    options_.path = directory_.path() / "absent" / "telemetry.db";
    auto session = framework().initWithSessionInfo(sessionInfo(), {}, {});
    EXPECT_EQ(backends(*session), std::nullopt);
    EXPECT_EQ(session->sendMessageWithCategory(4, 1, {})->domain, kStoreErrorDomain);
    EXPECT_EQ(framework_->sendOneMessageWithSessionInfo({}, {}, 4, 1, {})->message,
              "there is no store");
}

TEST_F(StoreRelayReportingTest, OnlyTheFrameworksThatWereAskedForAnswer) {
    auto& framework = this->framework();
    EXPECT_EQ(backends(*framework.initWithSessionInfo(sessionInfo(), {}, {Value("other")})),
              std::nullopt);
    EXPECT_EQ(backends(*framework.initWithSessionInfo(sessionInfo(), {}, {Value("store")})),
              List{Value("store")});
}

TEST_F(StoreRelayReportingTest, ATokenIsThirtyTwoRandomHexadecimalDigits) {
    random_.next = 0x0abc;
    EXPECT_EQ(framework().newSecureHierarchyTokenFromParentToken({}),
              Value("0abc0abc0abc0abc0abc0abc0abc0abc"));
    EXPECT_EQ(random_.lastBound, 0x10000U);
}

} // namespace
} // namespace halyard::linux_
