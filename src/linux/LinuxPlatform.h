// The platform made of the real adapters, and what runs them: the socket, the
// signals, the store, the configuration file.
//
// Made and served by main on its thread, which becomes the delivery thread of
// the connections.
#pragma once

#include <asio/io_context.hpp>
#include <asio/signal_set.hpp>
#include <asio/steady_timer.hpp>
#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "common/Result.h"
#include "linux/config/ConfigurationServices.h"
#include "linux/drivers/LinuxHWReport.h"
#include "linux/net/IdleExit.h"
#include "linux/net/OwnerRights.h"
#include "linux/net/SocketListener.h"
#include "linux/queues/ContextQueue.h"
#include "linux/queues/Pressure.h"
#include "linux/queues/Queues.h"
#include "linux/store/StoreServices.h"
#include "linux/system/Directories.h"
#include "linux/system/FreeMemory.h"
#include "linux/system/IncidentFolder.h"
#include "linux/system/LastResort.h"
#include "linux/system/LogWriter.h"
#include "linux/system/RemovalWatch.h"
#include "linux/system/SystemServices.h"
#include "linux/trace/TraceServices.h"
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

    // Opens the socket, inherited or made. Requires that the platform is installed.
    Result<void> open(platform::ListenerDelegate* delegate);
    // Serves until SIGTERM, SIGINT or the end of what the operator waits for somebody,
    // then ends every connection, delivers and
    // commits what was accepted.
    void serve();

private:
    void flush(std::function<void()> done) override;
    void purge(PurgeReply reply) override;
    Dictionary status() const override;

    void purgeStore(const PurgeReply& reply, const Result<void>& incidents);
    void makeServices(const Settings& settings);
    LinuxHWReport::Options driverOptions();
    void keepFilesPrivate(const Settings& settings);
    void applySettings(const Settings& settings);
    void watchStopSignals();
    void watchReloadSignal();
    void observeConfiguration();
    void armWatchdog();
    IdleExit::Actions whenIdle();
    void returnMemory();
    void beginShutdown();
    void stopReading();
    void logAccounts() const;
    void finishShutdown(bool inTime);
    void tellUndone();
    void saveWhatWasAccepted();
    [[noreturn]] void endAsItIs();
    PeerRights rightsOfPeer(const Peer& peer) const;

    const Directories directories_;
    asio::io_context context_;
    asio::signal_set stopSignals_;
    asio::signal_set reloadSignals_;
    asio::steady_timer watchdog_;
    asio::steady_timer readingLimit_;
    asio::steady_timer shutdownLimit_;

    LogWriter log_;
    SystemServices system_;
    Pressure pressure_;
    ConfigurationServices configuration_;
    ProcOwnProcess ownProcess_;
    std::unique_ptr<StoreServices> store_;
    std::optional<RemovalWatch> storeFiles_;
    std::unique_ptr<IncidentFolder> incidents_;
    OwnerRights ownerRights_; // the service queue's
    std::unique_ptr<LinuxHWReport> hwReport_;
    std::unique_ptr<TraceServices> traces_;
    std::unique_ptr<Queues> queues_;
    ContextQueue loop_;
    IdleExit idleExit_;
    FreeMemory freeMemory_;
    std::unique_ptr<SocketListener> listener_;
    platform::Platform platform_;
    platform::SteadyTime startTime_;
    bool socketInherited_ = false;
    bool stopping_ = false;
    std::atomic<bool> undoneTold_ = false;
    std::optional<LastResort> lastResort_; // Goes first.
};

} // namespace halyard::linux_
