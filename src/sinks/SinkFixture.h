// What the tests of all sinks need: a platform of fakes and a session.
#pragma once

#include <gtest/gtest.h>
#include <memory>

#include "platform/Platform.h"
#include "sinks/SessionFacts.h"
#include "testing/FakeEventServices.h"
#include "testing/FakeIncidentReporter.h"
#include "testing/RecordingLog.h"

namespace halyard {

struct FakeSessionFacts final : SessionFacts {
    AudioServiceType serviceType() const override { return type; }
    Dictionary configuration() const override {
        ++configurationReads;
        return settings;
    }

    AudioServiceType type = kAudioServiceTypeHaptics;
    Dictionary settings{{"HostApplicationDisplayID", "org.player"}};
    mutable int configurationReads = 0;
};

class SinkFixture : public ::testing::Test {
protected:
    SinkFixture() {
        platform_.log = &log_;
        platform_.analytics = &analytics_;
        platform_.energyLedger = &ledger_;
        platform_.metrics = &metrics_;
        platform_.incidentReporter = &incidents_;
        platform::install(&platform_);
    }
    ~SinkFixture() override { platform::install(nullptr); }

    testing::RecordingLog log_;
    testing::FakeAnalyticsService analytics_;
    testing::FakeEnergyLedger ledger_;
    testing::FakeMetricService metrics_;
    testing::FakeIncidentReporter incidents_;
    std::shared_ptr<FakeSessionFacts> session_ = std::make_shared<FakeSessionFacts>();
    platform::Platform platform_;
};

} // namespace halyard
