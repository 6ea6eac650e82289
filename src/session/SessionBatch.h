// The batch of a session: there is one while the session is started.
//
// Any thread may look at it, so it brings the lock that a batch lacks. Whether
// the session is started is known here, because that begins and ends with the
// batch.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "common/Mutex.h"
#include "session/MessageBatch.h"

namespace halyard {

class SessionBatch final {
public:
    struct Entry {
        std::string identifier;
        Dictionary message;
    };

    struct Verdict {
        bool redundant = false;
        // Repeats that this message put an end to.
        std::optional<platform::Repeats> repeats;
    };

    bool started() const { return started_.load(); }
    // With an empty batch, whatever there was before.
    void start(const MessageBatch::Options& options) HY_EXCLUDES(mutex_);
    void stop() HY_EXCLUDES(mutex_);

    // Records the message unless it is redundant. Without a batch nothing is recorded,
    // and nothing is redundant.
    [[nodiscard]] Verdict createMessageIdentifierWithCategory(AudioEventCategory category,
                                                              AudioEventType type,
                                                              const Dictionary& message)
        HY_EXCLUDES(mutex_);
    // What a message of `bytes` would add to what is kept; 0 without a batch.
    std::size_t growthBy(AudioEventCategory category, AudioEventType type, std::size_t bytes) const
        HY_EXCLUDES(mutex_);
    // Those that nothing has put an end to.
    std::vector<platform::Repeats> takeAllRepeats() HY_EXCLUDES(mutex_);
    // Redundant messages of all batches.
    std::uint64_t redundantMessages() const { return redundantMessages_.load(); }

    // What the messages amount to; nothing without a batch. The summary is handed
    // over: asked again it starts anew.
    std::vector<Dictionary> volumeMessages() const HY_EXCLUDES(mutex_);
    std::optional<Dictionary> takeSummary(AudioServiceType serviceType) HY_EXCLUDES(mutex_);
    // The text of the summary file; none for an empty batch.
    std::optional<std::string> summaryFileText() const HY_EXCLUDES(mutex_);

    // The number of the last accepted message of a base identifier, or 0.
    std::uint32_t countFor(std::string_view base) const HY_EXCLUDES(mutex_);
    // A copy. Empty where messages are not kept (see MessageBatch).
    std::vector<Entry> entries() const HY_EXCLUDES(mutex_);

private:
    std::atomic<bool> started_{false};
    std::atomic<std::uint64_t> redundantMessages_{0};
    mutable Mutex mutex_;
    std::unique_ptr<MessageBatch> batch_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard
