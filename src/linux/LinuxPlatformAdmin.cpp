// What operators ask the daemon for: see admin.status and admin.purge.
#include "linux/LinuxPlatform.h"
#include "linux/system/CollectedFiles.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

Dictionary describe(const ListenerCounters& counters) {
    return Dictionary{{"accepted", counters.accepted.load()},
                      {"refused", counters.refused.load()},
                      {"broken", counters.broken.load()},
                      {"requests", counters.requests.load()},
                      {"bad_requests", counters.badRequests.load()},
                      {"bytes_read", counters.bytesRead.load()}};
}

Error errorOf(const Failure& failure) {
    return {"posix", static_cast<std::int64_t>(failure.code), "cannot purge: " + failure.message()};
}

} // namespace

// In the order in which things are made of each other: what is on its way becomes rows
// and incidents, an incident becomes a folder and a row.
void LinuxPlatform::purge(PurgeReply reply) {
    queues_->drain([this, reply = std::move(reply)] {
        incidents_->whenIdle([this, reply] {
            const Result<void> removed = removeCollectedState(directories_.state);
            store_->store.flush([this, reply, removed] { purgeStore(reply, removed); });
        });
    });
}

void LinuxPlatform::purgeStore(const PurgeReply& reply, const Result<void>& incidents) {
    store_->store.purge([this, reply, incidents](const auto& rows) {
        // Again: a file that turned out to be damaged was set aside just now.
        const Result<void> state = removeCollectedState(directories_.state);
        const Result<void> logs = removeCollectedLogs(directories_.logs);
        for (const Result<void>* const result : {&incidents, &state, &logs}) {
            if (!result->ok()) {
                return reply(errorOf(result->failure()), 0);
            }
        }
        if (!rows.ok()) {
            return reply(errorOf(rows.failure()), 0);
        }
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "purged {} rows", rows.value());
        reply(std::nullopt, rows.value());
    });
}

Dictionary LinuxPlatform::status() const {
    const std::chrono::duration<double> uptime = system_.clock.steadyTime() - startTime_;
    const StoreStatus store = store_->store.status();
    return Dictionary{{"version", HALYARD_VERSION},
                      {"pid", ownProcess_.pid()},
                      {"uptime_sec", uptime.count()},
                      {"under_pressure", pressure_.isOn()},
                      {"delayed_messages", queues_->delayedTasks()},
                      {"log_lines_dropped", log_.droppedLines()},
                      {"listener", describe(listener_->counters())},
                      {"incidents", Dictionary{{"refused", incidents_->refusedSnapshots()},
                                               {"failed", incidents_->failedSnapshots()}}},
                      {"messages", platform_.messageAccounts.describe(settledMessages(store))},
                      {"store", describe(store)}};
}

} // namespace halyard::linux_
