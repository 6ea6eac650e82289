#include "linux/LinuxPlatform.h"

#include <asio/post.hpp>
#include <csignal>
#include <cstdlib>
#include <future>
#include <optional>
#include <systemd/sd-daemon.h>
#include <unistd.h>
#include <utility>

#include "common/Json.h"
#include "linux/queues/BlockingSection.h"
#include "linux/system/CollectedFiles.h"
#include "linux/system/PrivateFiles.h"
#include "platform/HYReportingUtilityDevice.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

constexpr const char* kSocketName = "reporting";
constexpr const char* kSocketFile = "reporting.sock";
constexpr const char* kCyclesFolder = "cycles";
// What is left to read fits into the sockets' buffers, unless the disk does not keep up.
constexpr std::chrono::seconds kReadingLimit{5};
// The end as a whole, whatever hangs, and what of it may go by before the store has to
// come to its own.
constexpr std::chrono::milliseconds kEndLimit{9500};
constexpr std::chrono::seconds kShutdownLimit{7};
constexpr std::chrono::milliseconds kCloseLimit{2000};

// What waits for the disk is accepted, and accepted means durable within half a
// second: these rows take a slow machine less than that.
constexpr StoreQueue::Marks kStoreMarks{12288, 6144, 16 * 1024 * 1024, 8 * 1024 * 1024};

StoreOptions storeOptions(const std::filesystem::path& directory, const Settings& settings,
                          Pressure& pressure) {
    StoreOptions options;
    options.path = directory / kStoreFile;
    options.limits = settings.store;
    options.marks = kStoreMarks;
    options.onOpened = [directory] { (void)keepStorePrivate(directory); };
    options.onPressure = [&pressure](bool on) { pressure.set(Pressure::Store, on); };
    return options;
}

} // namespace

LinuxPlatform::LinuxPlatform(Directories directories, platform::TraceMarks& traceMarks)
    : directories_(std::move(directories)), stopSignals_(context_, SIGTERM, SIGINT),
      reloadSignals_(context_, SIGHUP), watchdog_(context_), readingLimit_(context_),
      shutdownLimit_(context_), log_(LogWriter::defaultOutput()), system_(directories_),
      configuration_(directories_.configuration), ownProcess_([this] { saveWhatWasAccepted(); }),
      ownerRights_(
          system_.clock,
          [this] {
              const auto settings = configuration_.configuration.settings();
              return std::shared_ptr<const Access>(settings, &settings->access);
          },
          ::getuid()),
      loop_(context_), idleExit_(system_.clock, loop_, whenIdle()),
      freeMemory_(loop_, {residentBytes, [this] { returnMemory(); }}),
      startTime_(system_.clock.steadyTime()) {
    std::signal(SIGPIPE, SIG_IGN);
    platform_.log = &log_;
    platform_.ownProcess = &ownProcess_;
    platform_.operations = this;
    platform_.traceMarks = &traceMarks;
    system_.offerTo(platform_);
    configuration_.offerTo(platform_);
    platform::install(&platform_);

    configuration_.configuration.observe(
        [this](const Settings&, const Settings& after) { log_.setLevel(after.logLevel); });
    configuration_.follow(context_);
    makeServices(*configuration_.configuration.settings());
}

// What an earlier daemon, a service manager or an operator left behind as well.
void LinuxPlatform::keepFilesPrivate(const Settings& settings) {
    const std::string& name = settings.access.readers;
    const auto readers = name.empty() ? std::nullopt : groupNumber(name);
    if (!name.empty() && !readers) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "access.readers: there is no group {}", name);
    }
    setReaders(readers);
    if (const auto kept = keepCollectedPrivate(directories_.state, directories_.logs); !kept.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "cannot set who may read: {}",
                     kept.failure().message());
    }
}

// What depends on the settings.
void LinuxPlatform::makeServices(const Settings& settings) {
    keepFilesPrivate(settings);
    queues_ = std::make_unique<Queues>(context_, pressure_);
    platform_.queues = queues_.get();
    store_ = std::make_unique<StoreServices>(storeOptions(directories_.state, settings, pressure_),
                                             system_.clock, system_.random);
    store_->offerTo(platform_);
    storeFiles_.emplace(context_, directories_.state, kStoreFile,
                        [this] { store_->store.lookAfterFiles(); });
    incidents_ = std::make_unique<IncidentFolder>(
        system_.clock,
        IncidentFolder::Options{
            directories_.state / kIncidentsFolder, "/proc", [this] { return log_.recentLines(); },
            [this](const Dictionary& signature, std::string_view report, platform::WallTime) {
                (void)store_->store.addIncident(signature, report);
            }});
    platform_.incidentReporter = incidents_.get();
    hwReport_ =
        std::make_unique<LinuxHWReport>(system_.clock, settings.driverChannels, driverOptions());
    platform_.hwReport = hwReport_.get();
    traces_ = std::make_unique<TraceServices>(directories_, system_.clock, [this] {
        return listener_ ? listener_->connectedProcesses() : std::vector<std::int32_t>();
    });
    traces_->offerTo(platform_);
    applySettings(settings);
}

// Programs of users' sessions leave statistics in a folder beside the socket, and
// are trusted as those who may connect.
LinuxHWReport::Options LinuxPlatform::driverOptions() {
    LinuxHWReport::Options options;
    options.cycles = directories_.runtime / kCyclesFolder;
    options.trusts = [this](std::uint32_t uid) { return ownerRights_.mayConnect(uid); };
    if (const Result<void> made = SharedFolder::make(options.cycles); !made.ok()) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "no folder for statistics of cycles: {}",
                     made.failure().message());
        options.cycles.clear();
    }
    return options;
}

LinuxPlatform::~LinuxPlatform() {
    configuration_.watch.reset();
    queues_->stop();
    incidents_.reset();
    listener_.reset();
    if (!store_->store.close(kCloseLimit)) {
        endAsItIs();
    }
    logAccounts();
}

// Something hangs, such as a disk: nothing more can be saved, nor its thread waited for.
void LinuxPlatform::endAsItIs() {
    store_->store.tellUnwritten();
    logAccounts();
    log_.flush();
    std::_Exit(EXIT_SUCCESS);
}

void LinuxPlatform::applySettings(const Settings& settings) {
    store_->analytics.setWanted(settings.wantedEvents);
    store_->store.setLimits(settings.store);
    store_->store.setConsent(settings.exporting.consent);
    platform_.sessionRules.set(settings.sessions);
}

PeerRights LinuxPlatform::rightsOfPeer(const Peer& peer) const {
    return rightsOf(peer, configuration_.configuration.settings()->access, ::getuid());
}

Result<void> LinuxPlatform::open(platform::ListenerDelegate* delegate) {
    const std::optional<int> inherited = inheritedSocket(kSocketName);
    socketInherited_ = inherited.has_value();
    const Result<int> listening =
        inherited ? *inherited : listenAt((directories_.runtime / kSocketFile).string());
    if (!listening.ok()) {
        return listening.failure();
    }
    listener_ =
        std::make_unique<SocketListener>(context_, pressure_, listening.value(),
                                         [this](const Peer& peer) { return rightsOfPeer(peer); });
    listener_->setDelegate(delegate);
    if (HYReportingUtilityIsInternalBuild()) {
        listener_->keepThread(); // Sessions write a file when they end.
    }
    removeUnfinished(directories_.state, directories_.logs); // Nobody else runs here.
    listener_->setLimits(configuration_.configuration.settings()->clients);
    listener_->onClientRelieved([this] { queues_->clientRelieved(); });
    listener_->onConnectionsChanged([this](std::size_t connections) {
        idleExit_.connectionsChanged(connections);
        freeMemory_.released(); // If somebody has left, which this need not know.
    });
    watchStopSignals();
    watchReloadSignal();
    observeConfiguration();
    return {};
}

void LinuxPlatform::watchStopSignals() {
    stopSignals_.async_wait([this](const asio::error_code& error, int) {
        if (!error) {
            beginShutdown();
            watchStopSignals();
        }
    });
}

void LinuxPlatform::watchReloadSignal() {
    reloadSignals_.async_wait([this](const asio::error_code& error, int) {
        if (!error) {
            (void)configuration_.configuration.reload();
            watchReloadSignal();
        }
    });
}

void LinuxPlatform::observeConfiguration() {
    configuration_.configuration.observe([this](const Settings& before, const Settings& after) {
        applySettings(after);
        idleExit_.setLimit(after.idleExit);
        listener_->setLimits(after.clients);
        if (before.access.readers != after.access.readers) {
            keepFilesPrivate(after);
        }
    });
    idleExit_.setLimit(configuration_.configuration.settings()->idleExit);
    configuration_.announceChanges();
}

IdleExit::Actions LinuxPlatform::whenIdle() {
    return {[this](std::function<void()> done) { flush(std::move(done)); },
            [this](std::function<void(bool)> done) {
                listener_->stopAcceptingUnlessSomebodyComes(std::move(done));
            },
            [this] { beginShutdown(); }};
}

void LinuxPlatform::returnMemory() {
    returnFreeMemory();
    queues_->onEachThread([] { returnFreeMemory(); });
    store_->store.onThread([] { returnFreeMemory(); });
}

// The service queue answers the manager's watchdog: it is what must not hang.
void LinuxPlatform::armWatchdog() {
    std::uint64_t period = 0;
    if (::sd_watchdog_enabled(0, &period) <= 0) {
        return;
    }
    watchdog_.expires_after(std::chrono::microseconds(period / 2));
    watchdog_.async_wait([this](const asio::error_code& error) {
        if (!error) {
            queues_->onServiceQueue([] { ::sd_notify(0, "WATCHDOG=1"); });
            armWatchdog();
        }
    });
}

// Who waits for an answer waits for this thread as for the service queue's. Those that are
// there already keep their own priority.
void LinuxPlatform::serve() {
    applyPriority(platform::QueuePriority::UserInteractive);
    armWatchdog();
    ::sd_notify(0, "READY=1");
    listener_->resume();
}

// The end, in the order in which work comes in: nobody new, then what has been written
// to the connections and then none of these (which stops its sessions, as when it is
// lost, and so leaves their last deliveries), then everything that is on its way, down to
// the disk. Who waits on a socket that outlives us is served by the next. Only then does
// the loop stop that draining needs for its timers. A disk that hangs lets the limit
// pass; the store then tells what it could not write. The last resort is for what
// nobody has thought of.
void LinuxPlatform::beginShutdown() {
    if (std::exchange(stopping_, true)) {
        return;
    }
    ::sd_notify(0, "STOPPING=1");
    lastResort_.emplace(kEndLimit, [this] {
        tellUndone();
        endAsItIs();
    });
    if (!socketInherited_) {
        listener_->acceptTheLast();
    }
    listener_->finishReading([this] {
        readingLimit_.cancel();
        flush([this] { asio::post(context_, [this] { finishShutdown(true); }); });
    });
    readingLimit_.expires_after(kReadingLimit);
    readingLimit_.async_wait([this](const asio::error_code& error) {
        if (!error) {
            stopReading();
        }
    });
    shutdownLimit_.expires_after(kShutdownLimit);
    shutdownLimit_.async_wait([this](const asio::error_code& error) {
        if (!error) {
            finishShutdown(false);
        }
    });
}

void LinuxPlatform::stopReading() {
    HY_LOG_ERROR(HYReportingPlatformCategory,
                 "stopping with {} bytes unread that clients have written",
                 listener_->unreadBytes());
    listener_->closeAllConnections();
}

void LinuxPlatform::finishShutdown(bool inTime) {
    if (!inTime) {
        tellUndone();
    }
    context_.stop();
}

// On any thread; once.
void LinuxPlatform::tellUndone() {
    if (undoneTold_.exchange(true)) {
        return;
    }
    HY_LOG_ERROR(HYReportingPlatformCategory,
                 "stopping with work left undone: {} requests were not looked at",
                 queues_->waitingRequests());
}

// The service was asked to die at once; what it has answered need not. This runs
// in the middle of whatever asked: requests behind it are never looked at, and
// nobody hears of it, so only what came before is waited for.
void LinuxPlatform::saveWhatWasAccepted() {
    const BlockingSection blocking;
    const auto drained = std::make_shared<std::promise<void>>();
    flush([drained] { drained->set_value(); });
    (void)drained->get_future().wait_for(kShutdownLimit);
    (void)store_->store.close(kCloseLimit);
    logAccounts();
    log_.flush();
}

// The last sheet: nobody can ask for it any more.
void LinuxPlatform::logAccounts() const {
    const StoreStatus store = store_->store.status();
    Dictionary sheet = platform_.messageAccounts.describe(settledMessages(store));
    sheet.set("lost", sum(store.lost[static_cast<std::size_t>(StoreTable::UploadMessage)]));
    HY_LOG_DEFAULT(HYReportingPlatformCategory, "messages since the start: {}", toJson(sheet));
}

void LinuxPlatform::flush(std::function<void()> done) {
    queues_->drain([this, done = std::move(done)] { store_->store.flush(done); });
}

} // namespace halyard::linux_
