#include "session/SessionBatch.h"

#include <utility>

#include "common/Json.h"
#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "session/SummaryFile.h"

namespace halyard {

void SessionBatch::start(const MessageBatch::Options& options) {
    const MutexLock lock(mutex_);
    batch_ = std::make_unique<MessageBatch>(options);
    started_.store(true);
}

void SessionBatch::stop() {
    std::unique_ptr<MessageBatch> finished; // Freed after the lock.
    const MutexLock lock(mutex_);
    finished = std::move(batch_);
    started_.store(false);
}

SessionBatch::Verdict SessionBatch::createMessageIdentifierWithCategory(AudioEventCategory category,
                                                                        AudioEventType type,
                                                                        const Dictionary& message) {
    const MutexLock lock(mutex_);
    if (batch_ == nullptr) {
        return {};
    }
    if (!batch_->addUnlessRedundant(category, type, message)) {
        return {false, batch_->takeRepeats()};
    }
    redundantMessages_.fetch_add(1, std::memory_order_relaxed);
    HY_LOG_DEBUG(HYReportingSessionCategory, "dropping redundant event");
    const double now = platform::secondsSince1970(platform::current().clock->wallTime());
    return {true, batch_->noteRepeat(category, type, now)};
}

std::size_t SessionBatch::growthBy(AudioEventCategory category, AudioEventType type,
                                   std::size_t bytes) const {
    const MutexLock lock(mutex_);
    return batch_ != nullptr ? batch_->growthBy(category, type, bytes) : 0;
}

std::vector<platform::Repeats> SessionBatch::takeAllRepeats() {
    const MutexLock lock(mutex_);
    return batch_ != nullptr ? batch_->takeAllRepeats() : std::vector<platform::Repeats>();
}

std::vector<Dictionary> SessionBatch::volumeMessages() const {
    const MutexLock lock(mutex_);
    return batch_ != nullptr ? batch_->volumeEvents() : std::vector<Dictionary>();
}

std::optional<Dictionary> SessionBatch::takeSummary(AudioServiceType serviceType) {
    const MutexLock lock(mutex_);
    return batch_ != nullptr ? batch_->takeSummary(serviceType) : std::nullopt;
}

std::optional<std::string> SessionBatch::summaryFileText() const {
    const MutexLock lock(mutex_);
    if (batch_ == nullptr || batch_->empty()) {
        return std::nullopt;
    }
    return toPrettyJson(summaryFileContents(batch_->entries()));
}

std::uint32_t SessionBatch::countFor(std::string_view base) const {
    const MutexLock lock(mutex_);
    return batch_ != nullptr ? batch_->countFor(base) : 0;
}

std::vector<SessionBatch::Entry> SessionBatch::entries() const {
    const MutexLock lock(mutex_);
    std::vector<Entry> entries;
    if (batch_ != nullptr) {
        for (const MessageBatch::Entry& entry : batch_->entries()) {
            entries.push_back({entry.identifier(), entry.message});
        }
    }
    return entries;
}

} // namespace halyard
