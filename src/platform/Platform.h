// Everything the core needs from the system it runs on, as one object.
//
// Made by main out of the real adapters, or by a test's fixture out of fakes,
// and installed once for the process: the only global there is. The pieces are
// borrowed and must outlive the installation.
#pragma once

#include <mutex>

#include "platform/MessageAccounts.h"
#include "platform/SessionRules.h"

namespace halyard::platform {

class AnalyticsService;
class Clock;
class ConditionFactory;
class DeviceProperties;
class EnergyLedger;
class EventTrace;
class FeatureFlags;
class Files;
class HWReport;
class IncidentReporter;
class LogSink;
class MetricService;
class Notifications;
class Operations;
class OwnProcess;
class PerformanceTraces;
class Preferences;
class ProcessTable;
class QueueFactory;
class Random;
class RelayReportingFramework;
class ResultsFiles;
class TraceMarks;

// The kind of build that the device says it is. It stays what the first answer
// said, so it is kept with the platform whose device answered: one in the daemon,
// another in each test. Any thread.
class BuildKind {
public:
    bool isInternal(const DeviceProperties& device) const;

private:
    mutable std::once_flag asked_;
    mutable bool internal_ = false;
};

struct Platform {
    Clock* clock = nullptr;
    Random* random = nullptr;
    QueueFactory* queues = nullptr;
    ConditionFactory* conditions = nullptr;
    LogSink* log = nullptr;
    Files* files = nullptr;
    TraceMarks* traceMarks = nullptr;
    EventTrace* eventTrace = nullptr;
    ResultsFiles* resultsFiles = nullptr;
    PerformanceTraces* performanceTraces = nullptr;
    Preferences* preferences = nullptr;
    FeatureFlags* featureFlags = nullptr;
    DeviceProperties* deviceProperties = nullptr;
    Notifications* notifications = nullptr;
    ProcessTable* processTable = nullptr;
    OwnProcess* ownProcess = nullptr;
    RelayReportingFramework* relayReporting = nullptr;
    AnalyticsService* analytics = nullptr;
    EnergyLedger* energyLedger = nullptr;
    MetricService* metrics = nullptr;
    IncidentReporter* incidentReporter = nullptr;
    Operations* operations = nullptr;
    // Null where the system has no such statistics.
    HWReport* hwReport = nullptr;
    // Not borrowed, and why a platform cannot be copied.
    BuildKind buildKind = {};
    // Nor is this.
    MessageAccounts messageAccounts = {};
    SessionRules sessionRules = {};
};

// Replaces what was installed before; null uninstalls. Requires that no other
// thread uses the platform meanwhile.
void install(const Platform* platform);

// Requires an installed platform.
const Platform& current();

inline void count(MessageCount what) {
    current().messageAccounts.add(what);
}

} // namespace halyard::platform
