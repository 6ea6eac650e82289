// The upload by itself, as part of something that is no session.

#include "session/Upload.h"

#include <gmock/gmock.h>

#include "sinks/SinkFixture.h"
#include "testing/TestPlatform.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::IsEmpty;
using ::testing::SizeIs;

struct Owner final : SessionFacts {
    AudioServiceType serviceType() const override { return facts.type; }
    Dictionary configuration() const override { return facts.settings; }

    FakeSessionFacts facts;
    Upload upload{7, *this};
};

class UploadTest : public ::testing::Test {
protected:
    void relay(int number, bool wasStarted = true, bool redundant = false) {
        owner_->upload.relay(
            owner_,
            {.tagged = {{{"n", number}}, kAudioEventCategoryGroupHAL | 4, kAudioEventTypeStart},
             .original = {},
             .wasStarted = wasStarted,
             .redundant = redundant});
    }
    auto& uploads() { return platform_.relayReporting.uploads; }
    void run() { platform_.queues.runUntilIdle(); }

    testing::TestPlatform platform_;
    std::shared_ptr<Owner> owner_ = std::make_shared<Owner>();
};

TEST_F(UploadTest, OpensDeliversAndClosesInTheOrderOfTheCalls) {
    owner_->upload.start(owner_);
    relay(1);
    owner_->upload.stop(owner_, platform::UploadEnding::Stopped);
    relay(2);
    run();
    ASSERT_THAT(uploads(), SizeIs(1));
    ASSERT_THAT(uploads()[0]->messages, SizeIs(1));
    EXPECT_EQ(uploads()[0]->messages[0].payload["n"], Value(1));
    EXPECT_EQ(uploads()[0]->messages[0].category, kAudioEventCategoryPlayback);
    EXPECT_EQ(uploads()[0]->messages[0].type, kAudioEventTypeStart);
    EXPECT_EQ(uploads()[0]->flushes, 1);
    EXPECT_TRUE(uploads()[0]->closed);
    EXPECT_FALSE(owner_->upload.startedState());
}

TEST_F(UploadTest, TellsTheUploadSessionWhoseItIs) {
    owner_->upload.start(owner_);
    owner_->facts.type = kAudioServiceTypeAlarms; // Too late.
    run();
    EXPECT_EQ(uploads().at(0)->sessionInfo[platform::kRelayReportingSessionInfoSessionID],
              Value(7));
    EXPECT_EQ(uploads()[0]->sessionInfo[platform::kRelayReportingSessionInfoClientBundleID],
              Value("org.player"));
    EXPECT_EQ(uploads()[0]->userInfo[platform::kRelayReportingUserInfoServiceName],
              Value("haptics_session"));
}

TEST_F(UploadTest, WhatIsQueuedKeepsItsSession) {
    const std::weak_ptr<Owner> owner = owner_;
    owner_->upload.start(owner_);
    relay(1);
    owner_.reset();
    EXPECT_FALSE(owner.expired());
    run();
    EXPECT_TRUE(owner.expired());
    EXPECT_THAT(uploads().at(0)->messages, SizeIs(1));
}

TEST_F(UploadTest, BackendsThatAnswerAfterwardsFindNobody) {
    platform_.relayReporting.backends = testing::FakeRelayReporting::Backends::AnswerWhenTold;
    owner_->upload.start(owner_);
    platform_.queues.advance(9s);
    owner_.reset();
    platform_.log.clear();
    uploads().at(0)->answer(List{Value("store")});
    EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

TEST_F(UploadTest, WhatWasSentBeforeTheStartGoesOutOnItsOwn) {
    owner_->upload.start(owner_);
    relay(1, false);
    platform_.queues.advance(1s);
    EXPECT_THAT(uploads().at(0)->messages, IsEmpty());
    ASSERT_THAT(platform_.relayReporting.singles, SizeIs(1));
    EXPECT_EQ(platform_.relayReporting.singles[0].message.payload["n"], Value(1));
}

TEST_F(UploadTest, NeitherRepeatsNorTestSessionsAreDelivered) {
    owner_->upload.start(owner_);
    relay(1, true, true);
    run();
    owner_->facts.type = kAudioServiceTypeTest;
    relay(2);
    run();
    EXPECT_THAT(uploads().at(0)->messages, IsEmpty());
}

} // namespace
} // namespace halyard
