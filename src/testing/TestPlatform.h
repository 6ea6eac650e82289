// Every fake at once, installed as the process's platform for as long as this
// object lives. Member of a fixture, ahead of what uses the platform.
#pragma once

#include "platform/Platform.h"
#include "testing/FakeCondition.h"
#include "testing/FakeDevice.h"
#include "testing/FakeEventServices.h"
#include "testing/FakeIncidentReporter.h"
#include "testing/FakeOperations.h"
#include "testing/FakeRelayReporting.h"
#include "testing/FakeTraceMarks.h"
#include "testing/ManualClock.h"
#include "testing/ManualQueues.h"
#include "testing/Printers.h"
#include "testing/RecordingLog.h"

namespace halyard::testing {

class TestPlatform {
public:
    TestPlatform() { platform::install(&platform_); }
    ~TestPlatform() {
        queues.clear(); // What still hangs there may log while it goes.
        platform::install(nullptr);
    }
    TestPlatform(const TestPlatform&) = delete;
    TestPlatform& operator=(const TestPlatform&) = delete;

    ManualClock clock;
    FakeRandom random;
    ManualQueues queues{clock};
    FakeConditionFactory conditions;
    RecordingLog log;
    FakeTraceMarks traceMarks;
    FakePreferences preferences;
    FakeFeatureFlags featureFlags;
    FakeDeviceProperties deviceProperties;
    FakeNotifications notifications;
    FakeProcessTable processTable;
    FakeOwnProcess ownProcess;
    FakeRelayReporting relayReporting;
    FakeAnalyticsService analytics;
    FakeEnergyLedger energyLedger;
    FakeMetricService metrics;
    FakeIncidentReporter incidentReporter;
    FakeOperations operations;

private:
    const platform::Platform platform_{
        .clock = &clock,
        .random = &random,
        .queues = &queues,
        .conditions = &conditions,
        .log = &log,
        .traceMarks = &traceMarks,
        .preferences = &preferences,
        .featureFlags = &featureFlags,
        .deviceProperties = &deviceProperties,
        .notifications = &notifications,
        .processTable = &processTable,
        .ownProcess = &ownProcess,
        .relayReporting = &relayReporting,
        .analytics = &analytics,
        .energyLedger = &energyLedger,
        .metrics = &metrics,
        .incidentReporter = &incidentReporter,
        .operations = &operations,
    };
};

} // namespace halyard::testing
