#include "service/FeatureState.h"

#include "common/Json.h"
#include "service/ServiceFixture.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kAccessoryChanged =
    "com.kestrel.pinwheel.spatial-audio-accessory-feature.changed";
constexpr const char* kReporting = "com.kestrel.halyard.reporting";

class FeatureStateTest : public ServiceTest {
protected:
    // Internal builds keep the batch, which these tests look at.
    FeatureStateTest() : ServiceTest(true) {}

    void setDeviceName(const Value& name) {
        platform_.preferences.values[{"com.kestrel.halyard", "device_name"}] = name;
    }
    void setAccessory(const Value& value) {
        platform_.preferences.values[{"com.kestrel.pinwheel", "spatial-audio-accessory-feature"}] =
            value;
    }
    void post(std::string_view notification) {
        platform_.notifications.post(notification);
        run();
    }
    std::uint32_t setupsOf(std::int64_t id) const {
        return session(id)->messageIdentifierCount("Setup_Setup");
    }
};

TEST_F(FeatureStateTest, DefaultsHoldOnlyTheSwitchWhenNothingIsSet) {
    EXPECT_EQ(service_->getDefaults(), (Dictionary{{"disable_reporting", false}}));
}

TEST_F(FeatureStateTest, DefaultsAreReadOnceAndSwitchNothingOff) {
    setDeviceName("kitchen");
    platform_.preferences.values[{"com.kestrel.halyard", "disable_reporting"}] = true;
    restartService();
    setDeviceName("attic");
    EXPECT_EQ(service_->getDefaults(),
              (Dictionary{{"device_name", "kitchen"}, {"disable_reporting", true}}));
    EXPECT_TRUE(service_->isReportingEnabled());
}

TEST_F(FeatureStateTest, ADeviceNameOfAnyKindGoesIntoDefaultsAndStateAlike) {
    for (const Value& name : {Value("kitchen"), Value(7), Value(false), Value(List{Value("a")})}) {
        setDeviceName(name);
        restartService();
        EXPECT_EQ(service_->getDefaults()["device_name"], name);
        EXPECT_EQ(service_->getFeaturesState().value_or(Dictionary())["device_name"], name);
    }
}

TEST_F(FeatureStateTest, ThereIsNoStateWhenNothingIsSet) {
    platform_.log.clear();
    EXPECT_EQ(service_->getFeaturesState(), std::nullopt);
    EXPECT_TRUE(logged(LogLevel::Default, "getting features"));
}

TEST_F(FeatureStateTest, TheStateTellsWhenItWasRead) {
    setDeviceName("kitchen");
    setAccessory(true);
    platform_.clock.advance(499ms);
    EXPECT_EQ(service_->getFeaturesState(), (Dictionary{{"spatial-audio-accessory-feature", true},
                                                        {"device_name", "kitchen"},
                                                        {"hyreporting_timestamp", 1700000000.499},
                                                        {"systemuptime_sec", 1000}}));
}

TEST_F(FeatureStateTest, DefaultsAndStateHaveTheirKeysInAFixedOrder) {
    setDeviceName("kitchen");
    setAccessory(true);
    restartService();
    EXPECT_EQ(toJson(service_->getDefaults()),
              "{\"device_name\":\"kitchen\",\"disable_reporting\":false}");
    EXPECT_EQ(toJson(service_->getFeaturesState().value_or(Dictionary())),
              "{\"spatial-audio-accessory-feature\":true,\"device_name\":\"kitchen\","
              "\"hyreporting_timestamp\":1700000000,\"systemuptime_sec\":1000}");
}

TEST_F(FeatureStateTest, TheUptimeIsRoundedToTheNearestSecond) {
    setAccessory(0);
    platform_.clock.advance(500ms);
    const auto state = service_->getFeaturesState();
    ASSERT_TRUE(state.has_value());
    EXPECT_EQ((*state)["systemuptime_sec"].kind(), Value::Kind::Int);
    EXPECT_EQ((*state)["systemuptime_sec"], Value(1001));
}

TEST_F(FeatureStateTest, RegistersForTheNotificationsOfBothFeatures) {
    ASSERT_THAT(platform_.notifications.registrations, SizeIs(2));
    EXPECT_EQ(platform_.notifications.registrations[0].name, kAccessoryChanged);
    EXPECT_EQ(platform_.notifications.registrations[1].name, kReporting);
    EXPECT_EQ(platform_.notifications.registrations[1].queue, service_->serviceQueue());
    EXPECT_TRUE(logged(LogLevel::Default, "notify setup result 0 token 1"));
    EXPECT_TRUE(logged(LogLevel::Default, "notify setup result 0 token 2"));
}

TEST_F(FeatureStateTest, TellsWhichFeaturesItListensFor) {
    EXPECT_TRUE(logged(LogLevel::Info, "listening for features " +
                                           describe(describeFeatures(makeFeatureRecords()))));
    EXPECT_EQ(describeFeatures(makeFeatureRecords()).list()[1],
              Value(Dictionary{{"defaults_domain", "com.kestrel.halyard"},
                               {"feature_domain", "device_name"},
                               {"notification", "com.kestrel.halyard.reporting"}}));
}

TEST_F(FeatureStateTest, ARecordShowsTheTokenItWasGiven) {
    auto features = makeFeatureRecords();
    features[0].notifyToken = 5;
    EXPECT_EQ(describeFeatures(features).list()[0].dictionary()["notify_token"], Value(5));
    EXPECT_FALSE(describeFeatures(features).list()[1].dictionary().contains("notify_token"));
}

TEST_F(FeatureStateTest, AFailedRegistrationIsTold) {
    platform_.notifications.failureStatus = 9;
    restartService();
    EXPECT_TRUE(logged(LogLevel::Default, "notify setup result 9 token 0"));
    platform_.notifications.failureStatus = 0xFFFFFFFF;
    restartService();
    EXPECT_TRUE(logged(LogLevel::Default, "notify setup result -1 token 0"));
}

TEST_F(FeatureStateTest, AStartingSessionGetsTheState) {
    setDeviceName("kitchen");
    connect(100).createAndStart(7);
    const auto batch = session(7)->nestedAggregatedPayloadData();
    ASSERT_THAT(batch, SizeIs(1));
    EXPECT_EQ(batch[0].identifier, "Setup_Setup_1");
    EXPECT_EQ(batch[0].message["device_name"], Value("kitchen"));
    EXPECT_EQ(batch[0].message["audiotag"], Value("SetupSetup"));
}

TEST_F(FeatureStateTest, WithNothingSetAStartSendsNoSetup) {
    connect(100).createAndStart(7);
    EXPECT_THAT(session(7)->nestedAggregatedPayloadData(), IsEmpty());
}

TEST_F(FeatureStateTest, AChangeReachesStartedAndUnstartedSessions) {
    const Peer peer = connect(100);
    peer.create(6);
    peer.createAndStart(7);
    setAccessory(true);
    post(kAccessoryChanged);
    EXPECT_EQ(setupsOf(7), 1U);
    platform_.queues.advance(1s);
    ASSERT_THAT(platform_.relayReporting.singles, SizeIs(1)) << "from the unstarted one";
    EXPECT_EQ(platform_.relayReporting.singles[0].message.category, kAudioEventCategorySetup);
    EXPECT_EQ(platform_.relayReporting.singles[0].message.type, kAudioEventTypeSetup);
}

TEST_F(FeatureStateTest, AChangeReachesTheSessionsOfAllClients) {
    connect(100).createAndStart(7);
    const Peer other = connect(200);
    other.createAndStart(8);
    setAccessory(true);
    post(kAccessoryChanged);
    EXPECT_EQ(session(8, 1)->messageIdentifierCount("Setup_Setup"), 1U);
}

TEST_F(FeatureStateTest, TheDaemonsOwnNotificationSendsTheDeviceNameToAllSessions) {
    const Peer peer = connect(100);
    peer.create(6);
    peer.createAndStart(7);
    setDeviceName("kitchen");
    post(kReporting);
    platform_.queues.advance(1s);
    EXPECT_EQ(session(7)->nestedAggregatedPayloadData().at(0).message["device_name"],
              Value("kitchen"));
    ASSERT_THAT(platform_.relayReporting.singles, SizeIs(1)) << "from the unstarted one";
    EXPECT_EQ(platform_.relayReporting.singles[0].message.payload["device_name"], Value("kitchen"));
}

TEST_F(FeatureStateTest, AChangeIsLogged) {
    setDeviceName("kitchen");
    platform_.log.clear();
    post(kReporting);
    EXPECT_TRUE(logged(LogLevel::Info, "feature 2 changes"));
    EXPECT_TRUE(logged(LogLevel::Info, "defaults " + describe(*service_->getFeaturesState())));
}

TEST_F(FeatureStateTest, AChangeToNothingIsToldToNobody) {
    const Peer peer = connect(100);
    peer.create(6);
    peer.createAndStart(7);
    post(kAccessoryChanged);
    platform_.queues.advance(1s);
    EXPECT_TRUE(logged(LogLevel::Info, "defaults (null)"));
    EXPECT_EQ(setupsOf(7), 0U);
    EXPECT_THAT(platform_.relayReporting.singles, IsEmpty());
}

TEST_F(FeatureStateTest, AnUnchangedStateIsARepeat) {
    setDeviceName("kitchen");
    connect(100).createAndStart(7);
    platform_.clock.advance(1h);
    post(kReporting);
    EXPECT_EQ(setupsOf(7), 1U);
    EXPECT_EQ(platform_.log.count("dropping redundant event"), 1U);
}

TEST_F(FeatureStateTest, ANotificationThatComesAfterTheServiceDoesNothing) {
    service_ = nullptr;
    platform_.log.clear();
    post(kReporting);
    EXPECT_THAT(platform_.log.lines(), IsEmpty());
}

} // namespace
} // namespace halyard
