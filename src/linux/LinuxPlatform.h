// The platform made of the real adapters, and what runs them: the socket, the
// signals, the store, the configuration file.
//
// Made and served by main on its thread, which becomes the delivery thread of
// the connections.
#pragma once

#include <asio/io_context.hpp>
#include <asio/signal_set.hpp>
#include <asio/steady_timer.hpp>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "linux/config/Configuration.h"
#include "linux/config/ConfigurationWatch.h"
#include "linux/drivers/LinuxHWReport.h"
#include "linux/net/SocketListener.h"
#include "linux/queues/Pressure.h"
#include "linux/queues/Queues.h"
#include "linux/store/Store.h"
#include "linux/store/StoreEventServices.h"
#include "linux/store/StoreRelayReporting.h"
#include "linux/system/Directories.h"
#include "linux/system/IncidentFolder.h"
#include "linux/system/LinuxFacts.h"
#include "linux/system/LinuxFiles.h"
#include "linux/system/LogWriter.h"
#include "linux/system/NotificationCenter.h"
#include "linux/system/ProcProcessTable.h"
#include "linux/trace/BenchmarkResultsWriter.h"
#include "linux/trace/TraceCmdRecorder.h"
#include "linux/trace/TracefsEventTrace.h"
#include "platform/Operations.h"
#include "platform/Platform.h"
#include "platform/TraceMarks.h"

namespace halyard::linux_ {

class LinuxPlatform final : private platform::Operations {
public:
    // Borrows `traceMarks`. Requires directories that exist.
    LinuxPlatform(Directories directories, platform::TraceMarks& traceMarks);
    ~LinuxPlatform() override;

    const platform::Platform& platform() const { return platform_; }

    // Opens the socket, inherited or made; the text says why there is none.
    // Requires that the platform is installed.
    [[nodiscard]] std::optional<std::string> open(platform::ListenerDelegate* delegate);
    // Serves until SIGTERM or SIGINT, then ends every connection, delivers and
    // commits what was accepted.
    void serve();

private:
    void flush(std::function<void()> done) override;
    Dictionary status() const override;

    void applySettings(const Settings& settings);
    void watchStopSignals();
    void watchReloadSignal();
    void observeConfiguration();
    void armWatchdog();
    void beginShutdown();
    void finishShutdown(bool inTime);
    PeerRights rightsOfPeer(const Peer& peer) const;

    const Directories directories_;
    asio::io_context context_;
    asio::signal_set stopSignals_;
    asio::signal_set reloadSignals_;
    asio::steady_timer watchdog_;
    asio::steady_timer shutdownLimit_;

    SystemClock clock_;
    SystemRandom random_;
    SystemConditions conditions_;
    LinuxFiles files_;
    BenchmarkResultsFiles resultsFiles_;
    TraceCmdRecorder performanceTraces_;
    std::unique_ptr<TracefsEventTrace> eventTrace_;
    LogWriter log_;
    Pressure pressure_;
    Configuration configuration_;
    NotificationCenter notifications_;
    ProcProcessTable processTable_;
    ProcOwnProcess ownProcess_;
    std::unique_ptr<Store> store_;
    std::unique_ptr<StoreRelayReporting> relayReporting_;
    std::unique_ptr<StoreAnalyticsService> analytics_;
    std::unique_ptr<StoreEnergyLedger> energyLedger_;
    std::unique_ptr<StoreMetricService> metrics_;
    std::unique_ptr<IncidentFolder> incidents_;
    std::unique_ptr<LinuxHWReport> hwReport_;
    std::unique_ptr<Queues> queues_;
    std::unique_ptr<ConfigurationWatch> configurationWatch_;
    std::unique_ptr<SocketListener> listener_;
    platform::Platform platform_;
    platform::SteadyTime startTime_;
    bool stopping_ = false;
};

} // namespace halyard::linux_
