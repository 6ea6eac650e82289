#include "sinks/HYReportingTallyhubBridge.h"

#include "sinks/SinkFixture.h"

namespace halyard {
namespace {

class HYReportingTallyhubBridgeTest : public SinkFixture {
protected:
    void handle(const Dictionary& message) {
        HYReportingTallyhubBridge::handleEvent(&message, kAudioEventCategoryHWReporting,
                                               kAudioEventTypeHistogram, session_);
    }
};

TEST_F(HYReportingTallyhubBridgeTest, AsksForBothNamesInOrder) {
    handle({{"a", 1}});
    EXPECT_EQ(analytics_.asked,
              (std::vector<std::string>{"com.kestrel.halyard.HWReporting.Histogram",
                                        "com.kestrel.haptics.HWReporting.Histogram"}));
}

TEST_F(HYReportingTallyhubBridgeTest, WithoutAListenerNothingIsBuilt) {
    handle({{"a", 1}});
    EXPECT_TRUE(analytics_.events.empty());
    EXPECT_EQ(session_->configurationReads, 0);
    EXPECT_EQ(session_.use_count(), 1);
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(HYReportingTallyhubBridgeTest, EachListenerGetsItsOwnPayload) {
    analytics_.usesAll = true;
    handle({{"a", 1}});
    ASSERT_EQ(analytics_.events.size(), 2U);
    EXPECT_EQ(analytics_.events[0].name, "com.kestrel.halyard.HWReporting.Histogram");
    EXPECT_EQ(analytics_.events[1].name, "com.kestrel.haptics.HWReporting.Histogram");
    const Dictionary first = analytics_.events[0].builder();
    const Dictionary second = analytics_.events[1].builder();
    EXPECT_EQ(first, (Dictionary{{"a", 1}, {"HostApplicationDisplayID", "org.player"}}));
    EXPECT_EQ(first, second);
    EXPECT_NE(first.begin(), second.begin());
}

TEST_F(HYReportingTallyhubBridgeTest, OneListenerAloneIsServed) {
    analytics_.used = {"com.kestrel.haptics.HWReporting.Histogram"};
    handle({{"a", 1}});
    ASSERT_EQ(analytics_.events.size(), 1U);
    EXPECT_EQ(analytics_.events[0].name, "com.kestrel.haptics.HWReporting.Histogram");
}

TEST_F(HYReportingTallyhubBridgeTest, ThePayloadIsBuiltFromTheConfigurationOfThatMoment) {
    analytics_.usesAll = true;
    handle({{"HostApplicationDisplayID", "claimed"}});
    session_->settings = {{"HostApplicationDisplayID", "org.later"}};
    EXPECT_EQ(analytics_.events[0].builder(),
              (Dictionary{{"HostApplicationDisplayID", "org.later"}}));
}

TEST_F(HYReportingTallyhubBridgeTest, BuildersKeepMessageAndSessionAlive) {
    analytics_.usesAll = true;
    handle({{"text", "a text that lives on the heap"}});
    const std::weak_ptr<FakeSessionFacts> session = session_;
    session_.reset();
    EXPECT_FALSE(session.expired());
    EXPECT_EQ(analytics_.events[0].builder()["text"], Value("a text that lives on the heap"));
    analytics_.events.clear();
    EXPECT_TRUE(session.expired());
}

TEST_F(HYReportingTallyhubBridgeTest, WithoutAnApplicationNameTheClientsClaimIsDropped) {
    const Dictionary message{{"HostApplicationDisplayID", "claimed"}, {"a b", 1}};
    EXPECT_EQ(HYReportingTallyhubBridge::payload(message, Value()).whole(),
              (Dictionary{{"a b", 1}}));
    EXPECT_EQ(message.size(), 2U);
}

TEST_F(HYReportingTallyhubBridgeTest, ASessionWithoutAnApplicationIsUnknown) {
    analytics_.usesAll = true;
    session_->settings = {};
    handle({{"a", 1}});
    EXPECT_EQ(analytics_.events[0].builder()["HostApplicationDisplayID"], Value("Unknown"));
}

TEST_F(HYReportingTallyhubBridgeTest, NamelessValuesGoOutUnderTheirFallbackNames) {
    session_->type = 999;
    const Dictionary message{{"a", 1}};
    HYReportingTallyhubBridge::handleEvent(&message, 0x00030000, 19, session_);
    EXPECT_EQ(analytics_.asked,
              (std::vector<std::string>{"com.kestrel.halyard._Undefined.Generic",
                                        "com.kestrel.telephony._Undefined.Generic"}));
}

TEST_F(HYReportingTallyhubBridgeTest, AnAbsentMessageIsOfNoInterest) {
    HYReportingTallyhubBridge::handleEvent(nullptr, 1, 1, session_);
    EXPECT_TRUE(analytics_.asked.empty());
}

} // namespace
} // namespace halyard
