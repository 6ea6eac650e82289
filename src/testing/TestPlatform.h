// Every fake at once, installed as the process's platform for as long as this
// object lives. Member of a fixture, ahead of what uses the platform.
#pragma once

#include <fmt/core.h>

#include "platform/Platform.h"
#include "testing/FakeCondition.h"
#include "testing/FakeDevice.h"
#include "testing/FakeEventServices.h"
#include "testing/FakeEventTrace.h"
#include "testing/FakeFiles.h"
#include "testing/FakeHWReport.h"
#include "testing/FakeIncidentReporter.h"
#include "testing/FakeOperations.h"
#include "testing/FakePerformanceTraces.h"
#include "testing/FakeRelayReporting.h"
#include "testing/FakeResultsFiles.h"
#include "testing/FakeTraceMarks.h"
#include "testing/ManualClock.h"
#include "testing/ManualQueues.h"
#include "testing/Printers.h"
#include "testing/RecordingLog.h"

namespace halyard::testing {

class TestPlatform {
    // Ahead of the fakes, so that it outlives them: what they kept may ask the
    // platform for its log and its marks while it goes.
    struct Installation {
        ~Installation() { platform::install(nullptr); }
        const platform::Platform platform;
    };
    Installation installation_;

public:
    TestPlatform()
        : installation_{{.clock = &clock,
                         .random = &random,
                         .queues = &queues,
                         .conditions = &conditions,
                         .log = &log,
                         .files = &files,
                         .traceMarks = &traceMarks,
                         .eventTrace = &eventTrace,
                         .resultsFiles = &resultsFiles,
                         .performanceTraces = &performanceTraces,
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
                         .hwReport = &hwReport}} {
        platform::install(&installation_.platform);
    }
    ~TestPlatform() { queues.clear(); }
    TestPlatform(const TestPlatform&) = delete;
    TestPlatform& operator=(const TestPlatform&) = delete;

    // From now on the log shows marks and questions to the analytics, too, as "mark
    // 2104482c" and "asked NAME": what came before what can be read there.
    void logMarksAndQuestions() {
        traceMarks.onMark = [this](std::uint32_t code) { note(fmt::format("mark {:x}", code)); };
        analytics.onAsked = [this](std::string_view name) { note(fmt::format("asked {}", name)); };
    }

    RecordingLog log;
    FakeTraceMarks traceMarks;
    ManualClock clock;
    FakeRandom random;
    ManualQueues queues{clock};
    FakeConditionFactory conditions;
    FakeFiles files;
    FakeEventTrace eventTrace;
    FakeResultsFiles resultsFiles;
    FakePerformanceTraces performanceTraces;
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
    FakeHWReport hwReport;

private:
    void note(std::string_view text) {
        log.write({LogLevel::Debug, LogCategory(), {}, 0, {}, text});
    }
};

} // namespace halyard::testing
