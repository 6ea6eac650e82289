// The store: telemetry.db in the state directory, behind the upload framework,
// the analytics service, the energy ledger, the metric service and the incident
// reporter.
//
// Adding a row costs the caller a reference and a short lock; everything else
// happens on the store's own thread, which writes rows in the order in which
// they were added and commits them in groups. While nothing can be written the
// daemon goes on: see StoreQueue for what is kept and StoreStatus for what was
// not.
//
// Any thread. docs/store.md describes the file.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <thread>

#include "linux/store/StoreWriter.h"

namespace halyard::linux_ {

struct StoreEnding;

// As admin.status shows it.
Dictionary describe(const StoreStatus& store);
// Messages that were committed or counted as lost.
std::uint64_t settledMessages(const StoreStatus& store);

class Store final {
public:
    // Opens or creates the file, which may take a moment when it is damaged.
    // Borrows `clock`, which must outlive the store's thread (see close()).
    Store(const StoreOptions& options, const platform::Clock& clock);
    ~Store();
    Store(const Store&) = delete;
    Store& operator=(const Store&) = delete;

    // False when the store cannot be opened at all; it stays so. Everything that
    // is added is counted as lost then, but for messages: there is no back end for them.
    bool isOpen() const { return open_; }

    // Writes the session's row. Never null.
    StoreUploadPtr openUpload(std::int64_t sessionID, const Dictionary& sessionInfo,
                              const Dictionary& userInfo);
    // Requires that nothing more is added to it.
    void closeUpload(const StoreUploadPtr& upload,
                     platform::UploadEnding ending = platform::UploadEnding::Stopped);

    // False when the row was dropped, which happens only while nothing can be
    // written.
    [[nodiscard]] bool addMessage(const StoreUploadPtr& upload, std::uint16_t category,
                                  std::uint32_t type, Dictionary payload);
    bool addRepeats(const StoreUploadPtr& upload, const platform::Repeats& repeats);
    [[nodiscard]] bool addSingleMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                                        std::uint16_t category, std::uint32_t type,
                                        const Dictionary& payload);
    // `builder` is called once at most: on the store's thread, or at once while
    // rows pile up, so that their size is known.
    bool addAnalyticsEvent(const Value& name, StoreAnalyticsRow::Builder builder);
    bool addEnergyEvent(std::uint32_t client, std::string_view name, const Dictionary& payload);
    bool addMetric(std::uint32_t metricID, std::string message);
    // `report` is a path or a text.
    bool addIncident(const Dictionary& signature, std::string_view report);

    // Calls `done` once every row added before is committed or counted as lost: on
    // the store's thread, or at once when nothing is waiting.
    void flush(std::function<void()> done) { queue_->flush(std::move(done)); }

    // Takes out all that was committed: see StoreDatabase::purge. The answer comes on the
    // store's thread, at once without a store.
    void purge(StoreWriter::PurgeReply reply);

    // Runs a task on the store's thread, between two groups; never without a store.
    void onThread(std::function<void()> task) { writer_->onThread(std::move(task)); }

    // Somebody may have removed or replaced the files: has the store's thread look now.
    void lookAfterFiles() { queue_->wake(); }

    void setLimits(StoreLimits limits) { writer_->setLimits(limits); }
    // Whether the owner agrees, from now on, that rows may leave the machine: noted in
    // the file, see StoreFacts.
    void setConsent(bool given) { writer_->setConsent(given); }
    StoreStatus status() const { return writer_->status(); }

    // Writes what is waiting, moves the write-ahead log into the file and closes
    // it. False when that did not end within the limit: it goes on then and may be
    // waited for again, but once this object is destroyed its thread is left
    // behind, and the process should end without tearing anything down.
    // What it leaves unwritten is told, once.
    [[nodiscard]] bool close() { return close(closeLimit_); }
    [[nodiscard]] bool close(std::chrono::nanoseconds limit);
    // The same for an end that does not come to that. Any thread.
    void tellUnwritten();

private:
    void hurryFor(std::uint16_t category);
    double now() const { return platform::secondsSince1970(clock_.wallTime()); }

    const platform::Clock& clock_;
    const std::chrono::nanoseconds closeLimit_;
    // Shared with the threads, which a dead file system may keep for longer than
    // this object lives.
    const std::shared_ptr<StoreEnding> ending_;
    const std::shared_ptr<StoreQueue> queue_;
    const std::shared_ptr<StoreWriter> writer_;
    bool open_ = false;
    std::atomic<bool> toldUnwritten_{false};
    std::thread writing_;
    std::thread watching_;
};

} // namespace halyard::linux_
