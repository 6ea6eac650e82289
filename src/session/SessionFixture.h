// What the tests of sessions share: a platform of fakes and short ways to make,
// feed and look at a session.
#pragma once

#include <gmock/gmock.h>
#include <memory>
#include <string>
#include <vector>

#include "session/HYReportingSession.h"
#include "testing/TestPlatform.h"

namespace halyard {

class SessionTest : public ::testing::Test {
protected:
    // Internal builds keep the batch, which these tests look at.
    SessionTest() { platform_.deviceProperties.booleans["InternalBuild"] = true; }

    static constexpr std::int64_t kReporterID = 7;
    static constexpr std::int32_t kOwner = 100;

    // Not relayed, as the constructor leaves it.
    static std::shared_ptr<HYReportingSession> makeSession() {
        return HYReportingSession::initWithID(kReporterID, {kOwner});
    }
    static std::shared_ptr<HYReportingSession>
    makeRelayedSession(AudioServiceType type = kAudioServiceTypeLongFormAudio) {
        auto session = makeSession();
        session->setServiceType(type);
        session->setRelayReportingEnabled(true);
        return session;
    }

    // A message of category Playback and type Start.
    static void send(HYReportingSession& session, const Dictionary& message) {
        session.sendMessage(message, kAudioEventCategoryPlayback, kAudioEventTypeStart, nullptr);
    }
    static std::vector<std::string> identifiers(const HYReportingSession& session) {
        std::vector<std::string> result;
        for (const auto& message : session.nestedAggregatedPayloadData()) {
            result.push_back(message.identifier);
        }
        return result;
    }

    void run() { platform_.queues.runUntilIdle(); }
    testing::FakeRelayReporting::Upload& upload() {
        return *platform_.relayReporting.uploads.back();
    }
    // What clients sent under "n", in the order of arrival. The text that a
    // summary makes of it does not count.
    std::vector<std::int64_t> uploaded() {
        std::vector<std::int64_t> result;
        for (const auto& message : upload().messages) {
            if (const Value& number = message.payload["n"]; number.isInteger()) {
                result.push_back(number.integerValue());
            }
        }
        return result;
    }
    bool logged(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingSessionCategory, text);
    }
    bool loggedByRelay(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingSessionRelayReportingCategory, text);
    }

    testing::TestPlatform platform_;
};

} // namespace halyard
