#include "linux/store/Store.h"

#include <array>
#include <atomic>
#include <condition_variable>
#include <csignal>
#include <pthread.h>
#include <utility>

#include "common/HYReportingUtility.h"
#include "common/Mutex.h"

namespace halyard::linux_ {

// How the writer's thread tells that it has ended, and the watch is told to. The watch
// sleeps while the writer does, so that an idle daemon does not wake up, and looks at
// its work more often while clients are held back for it.
struct StoreEnding {
    Mutex mutex;
    std::condition_variable_any changed;
    std::atomic<bool> armed{false};
    bool writerEnded HY_GUARDED_BY(mutex) = false;
    bool closing HY_GUARDED_BY(mutex) = false;
    bool pressed HY_GUARDED_BY(mutex) = false;

    // True while there is a reason to look after the writer. Waits for one.
    bool waitForWatch(std::chrono::nanoseconds pressedPeriod, std::chrono::nanoseconds period)
        HY_EXCLUDES(mutex) {
        const MutexLock lock(mutex);
        while (!closing && !pressed && !armed) {
            changed.wait(mutex);
        }
        if (!closing) {
            changed.wait_for(mutex, pressed ? pressedPeriod : period);
        }
        return !closing;
    }
    void press(bool on) HY_EXCLUDES(mutex) {
        const MutexLock lock(mutex);
        pressed = on;
        changed.notify_all();
    }
    // Called for every commit, and all but free while the watch is awake.
    void arm() HY_EXCLUDES(mutex) {
        if (!armed.exchange(true)) {
            const MutexLock lock(mutex);
            changed.notify_all();
        }
    }
};

namespace {

// Signals are for the main thread.
std::thread startThread(const char* name, std::function<void()> body) {
    return std::thread([name, body = std::move(body)] {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_BLOCK, &all, nullptr);
        pthread_setname_np(pthread_self(), name);
        body();
    });
}

std::shared_ptr<StoreQueue> makeQueue(const StoreOptions& options,
                                      const std::shared_ptr<StoreEnding>& ending) {
    return std::make_shared<StoreQueue>(options.marks, storeWindow(options, options.limits),
                                        [ending, told = options.onPressure](bool on) {
                                            ending->press(on);
                                            if (told) {
                                                told(on);
                                            }
                                        });
}

template <std::size_t Size, class Name>
Dictionary named(const std::array<std::uint64_t, Size>& counts, Name nameOf) {
    Dictionary result;
    for (std::size_t i = 0; i < Size; ++i) {
        result.set(nameOf(i), counts[i]);
    }
    return result;
}

} // namespace

Dictionary describe(const StoreStatus& store) {
    const auto table = [](std::size_t i) { return kStoreSchema[i].name; };
    const auto loss = [](std::size_t i) { return kStoreLossNames[i].inStatus; };
    Dictionary lost;
    for (std::size_t i = 0; i < kStoreTables; ++i) {
        lost.set(table(i), named(store.lost[i], loss));
    }
    return Dictionary{{"open", store.open},
                      {"failing", store.failing},
                      {"rows", named(store.rows, table)},
                      {"lost", lost},
                      {"removed", named(store.removed, table)},
                      {"commits", store.commits},
                      {"queued_rows", store.queuedRows},
                      {"queued_bytes", store.queuedBytes},
                      {"oldest_waiting_sec", store.oldestWaiting},
                      {"file_bytes", store.fileBytes},
                      {"log_bytes", store.logBytes}};
}

std::uint64_t settledMessages(const StoreStatus& store) {
    const auto messages = static_cast<std::size_t>(StoreTable::UploadMessage);
    return store.rows[messages] + sum(store.lost[messages]);
}

Store::Store(const StoreOptions& options, const platform::Clock& clock)
    : clock_(clock), closeLimit_(options.closeLimit), ending_(std::make_shared<StoreEnding>()),
      queue_(makeQueue(options, ending_)),
      writer_(std::make_shared<StoreWriter>(options, clock, queue_,
                                            [ending = ending_] { ending->arm(); })),
      open_(writer_->open()) {
    if (!open_) {
        return;
    }
    writing_ = startThread("store", [writer = writer_, ending = ending_] {
        writer->run();
        const MutexLock lock(ending->mutex);
        ending->writerEnded = true;
        ending->changed.notify_all();
    });
    watching_ = startThread("store watch",
                            [writer = writer_, ending = ending_, pressed = options.watchPeriod,
                             period = options.calmWatchPeriod] {
                                while (ending->waitForWatch(pressed, period)) {
                                    writer->watch();
                                    // In this order: work that begins in between is seen, or arms
                                    // anew.
                                    ending->armed = false;
                                    if (writer->isWorking()) {
                                        ending->armed = true;
                                    }
                                }
                            });
}

Store::~Store() {
    if (watching_.joinable()) {
        (void)close();
    }
    if (writing_.joinable()) {
        writing_.detach();
    }
}

bool Store::close(std::chrono::nanoseconds limit) {
    if (!writing_.joinable()) {
        return true;
    }
    queue_->stop();
    bool ended = false;
    {
        const MutexLock lock(ending_->mutex);
        ending_->closing = true;
        ending_->changed.notify_all();
        const auto until = std::chrono::steady_clock::now() + limit;
        while (!ending_->writerEnded &&
               ending_->changed.wait_until(ending_->mutex, until) != std::cv_status::timeout) {
        }
        ended = ending_->writerEnded;
    }
    if (watching_.joinable()) {
        watching_.join();
    }
    if (ended) {
        writing_.join();
    } else {
        tellUnwritten();
    }
    return ended;
}

void Store::tellUnwritten() {
    if (!toldUnwritten_.exchange(true)) {
        writer_->tellUnwritten();
    }
}

void Store::purge(StoreWriter::PurgeReply reply) {
    if (open_) {
        return writer_->purge(std::move(reply));
    }
    reply(StoreFailure{{{}, "the daemon runs without a store"}, SQLITE_CANTOPEN});
}

StoreUploadPtr Store::openUpload(std::int64_t sessionID, const Dictionary& sessionInfo,
                                 const Dictionary& userInfo) {
    auto upload = std::make_shared<StoreUpload>();
    upload->sessionID = sessionID;
    upload->sessionInfo = sessionInfo;
    upload->userInfo = userInfo;
    upload->opened = now();
    upload->accepted = queue_->push(StoreOpenRow{upload}, 0, StoreQueue::OnDrop::KeepQuiet);
    return upload;
}

void Store::closeUpload(const StoreUploadPtr& upload, platform::UploadEnding ending) {
    // One that got no row so far gets it now, or is counted as lost.
    if (!upload->accepted) {
        upload->accepted = queue_->push(StoreOpenRow{upload});
    }
    if (upload->accepted) {
        queue_->pushAlways(StoreCloseRow{upload, ending, now()});
    }
}

bool Store::addMessage(const StoreUploadPtr& upload, std::uint16_t category, std::uint32_t type,
                       Dictionary payload) {
    if (!open_) {
        return false; // No back end is none that lost it.
    }
    const bool taken =
        queue_->push(StoreMessageRow{upload, std::move(payload), type, category, now()});
    hurryFor(category);
    if (taken && !upload->accepted.load(std::memory_order_relaxed)) {
        upload->accepted = true;
    }
    return taken;
}

bool Store::addRepeats(const StoreUploadPtr& upload, const platform::Repeats& repeats) {
    const bool taken = queue_->push(StoreRepeatRow{upload, repeats});
    if (taken) {
        upload->accepted = true;
    }
    return taken;
}

bool Store::addSingleMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                             std::uint16_t category, std::uint32_t type,
                             const Dictionary& payload) {
    const bool taken = open_ && queue_->push(StoreSingleRow{sessionInfo, userInfo, payload, type,
                                                            category, now()});
    hurryFor(category);
    return taken;
}

// Who asks for a long interval trades what a kill costs for wear, but not the reports
// of what went wrong.
void Store::hurryFor(std::uint16_t category) {
    if (category == kAudioEventCategoryError) {
        queue_->hurry();
    }
}

bool Store::addAnalyticsEvent(const Value& name, StoreAnalyticsRow::Builder builder) {
    StoreAnalyticsRow row{name, std::move(builder), now()};
    std::size_t hidden = 0;
    if (queue_->wantsFinishedRows()) {
        row.build();
    } else {
        hidden = queue_->payloadsOf(platform::ClientBudget::current()).bytes();
    }
    return queue_->push(std::move(row), hidden);
}

bool Store::addEnergyEvent(std::uint32_t client, std::string_view name, const Dictionary& payload) {
    return queue_->push(StoreEnergyRow{name, payload, client, now()});
}

bool Store::addMetric(std::uint32_t metricID, std::string message) {
    return queue_->push(StoreMetricRow{std::move(message), metricID, now()});
}

bool Store::addIncident(const Dictionary& signature, std::string_view report) {
    return queue_->push(StoreIncidentRow{signature, report, now()});
}

} // namespace halyard::linux_
