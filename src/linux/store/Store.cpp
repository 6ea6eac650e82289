#include "linux/store/Store.h"

#include <array>
#include <condition_variable>
#include <csignal>
#include <pthread.h>
#include <utility>

#include "common/Mutex.h"

namespace halyard::linux_ {

// How the writer's thread tells that it has ended, and the watch is told to.
struct StoreEnding {
    Mutex mutex;
    std::condition_variable_any changed;
    bool writerEnded HY_GUARDED_BY(mutex) = false;
    bool closing HY_GUARDED_BY(mutex) = false;
    bool pressed HY_GUARDED_BY(mutex) = false;

    // True while there is a reason to look after the writer. Waits for one.
    bool waitForWatch(std::chrono::nanoseconds period) HY_EXCLUDES(mutex) {
        const MutexLock lock(mutex);
        while (!closing && !pressed) {
            changed.wait(mutex);
        }
        if (!closing) {
            changed.wait_for(mutex, period);
        }
        return !closing;
    }
    void press(bool on) HY_EXCLUDES(mutex) {
        const MutexLock lock(mutex);
        pressed = on;
        changed.notify_all();
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

// Whoever is held back by a writer that hangs must be let go.
StoreOptions withWatch(StoreOptions options, const std::shared_ptr<StoreEnding>& ending) {
    options.onPressure = [ending, told = std::move(options.onPressure)](bool on) {
        ending->press(on);
        if (told) {
            told(on);
        }
    };
    return options;
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
    return Dictionary{{"open", store.open},
                      {"failing", store.failing},
                      {"rows", named(store.rows, table)},
                      {"lost", named(store.lost, loss)},
                      {"commits", store.commits},
                      {"queued_rows", store.queuedRows},
                      {"queued_bytes", store.queuedBytes},
                      {"file_bytes", store.fileBytes},
                      {"log_bytes", store.logBytes}};
}

Store::Store(StoreOptions options, const platform::Clock& clock)
    : ending_(std::make_shared<StoreEnding>()),
      writer_(std::make_shared<StoreWriter>(withWatch(std::move(options), ending_), clock)),
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
    watching_ = startThread("store watch", [writer = writer_, ending = ending_] {
        while (ending->waitForWatch(writer->options().watchPeriod)) {
            writer->watch();
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

bool Store::close() {
    if (!writing_.joinable()) {
        return true;
    }
    writer_->queue().stop();
    bool ended = false;
    {
        const MutexLock lock(ending_->mutex);
        ending_->closing = true;
        ending_->changed.notify_all();
        const auto until = std::chrono::steady_clock::now() + writer_->options().closeLimit;
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
    }
    return ended;
}

StoreUploadPtr Store::openUpload(std::int64_t sessionID, const Dictionary& sessionInfo,
                                 const Dictionary& userInfo) {
    auto upload = std::make_shared<StoreUpload>();
    upload->sessionID = sessionID;
    upload->sessionInfo = sessionInfo;
    upload->userInfo = userInfo;
    upload->opened = writer_->now();
    upload->accepted =
        writer_->queue().push(StoreOpenRow{upload}, 0, StoreQueue::OnDrop::KeepQuiet);
    return upload;
}

void Store::closeUpload(const StoreUploadPtr& upload) {
    // One that got no row so far gets it now, or is counted as lost.
    if (!upload->accepted) {
        upload->accepted = writer_->queue().push(StoreOpenRow{upload});
    }
    if (upload->accepted) {
        writer_->queue().pushAlways(StoreCloseRow{upload, writer_->now()});
    }
}

bool Store::addMessage(const StoreUploadPtr& upload, std::uint16_t category, std::uint32_t type,
                       Dictionary payload) {
    const bool taken = writer_->queue().push(
        StoreMessageRow{upload, std::move(payload), type, category, writer_->now()});
    if (taken && !upload->accepted.load(std::memory_order_relaxed)) {
        upload->accepted = true;
    }
    return taken;
}

bool Store::addSingleMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                             std::uint16_t category, std::uint32_t type,
                             const Dictionary& payload) {
    return writer_->queue().push(
        StoreSingleRow{sessionInfo, userInfo, payload, type, category, writer_->now()});
}

bool Store::addAnalyticsEvent(const Value& name, std::function<Dictionary()> builder) {
    StoreAnalyticsRow row{name, std::move(builder), {}, writer_->now()};
    std::size_t hidden = 0;
    if (writer_->queue().wantsFinishedRows()) {
        row.payload = row.builder();
        row.builder = nullptr;
    } else {
        hidden = writer_->expectedPayloadBytes();
    }
    return writer_->queue().push(std::move(row), hidden);
}

bool Store::addEnergyEvent(std::uint32_t client, std::string_view name, const Dictionary& payload) {
    return writer_->queue().push(StoreEnergyRow{name, payload, client, writer_->now()});
}

bool Store::addMetric(std::uint32_t metricID, std::string message) {
    return writer_->queue().push(StoreMetricRow{std::move(message), metricID, writer_->now()});
}

bool Store::addIncident(const Dictionary& signature, std::string_view report) {
    return writer_->queue().push(StoreIncidentRow{signature, report, writer_->now()});
}

} // namespace halyard::linux_
