// The messages that a running session accepts, and the rule that keeps repeats
// out.
//
// Each message bears the identifier Category_Type_N, N counting from 1 for each
// "Category_Type". A message is redundant when it equals the message accepted
// last under the same "Category_Type" in everything but its time stamps. That
// one is kept with its kind, so that the cost of a message does not grow with
// the batch.
//
// What the session derives from its messages when it stops is followed as they
// come. The messages themselves are kept only where somebody will read them, in
// the file of internal builds: a session of a million messages is otherwise a
// few texts.
//
// Not thread-safe: the session locks it.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"
#include "platform/ClientBudget.h"
#include "platform/RelayReporting.h"
#include "session/SessionEvents.h"

namespace halyard {

class MessageBatch {
public:
    struct Options {
        bool keepsMessages = true;
        double minimumPlaytime = 0.5; // seconds; see VolumeStretches
        std::size_t summaryBytes = platform::ClientLimits{}.summary;
        platform::ClientBudgetPtr owner{}; // pays for what no client sent; may be null
    };
    struct Entry {
        const std::string* base; // "Category_Type"; owned by the batch
        std::uint32_t count;
        Dictionary message;

        // Built only where somebody reads it.
        std::string identifier() const { return *base + '_' + std::to_string(count); }
    };

    MessageBatch() : MessageBatch(Options{}) {}
    explicit MessageBatch(const Options& options)
        : keepsMessages_(options.keepsMessages), owner_(options.owner),
          volumes_(options.minimumPlaytime), summary_(options.summaryBytes) {}
    MessageBatch(const MessageBatch&) = delete; // entries point into kinds_
    MessageBatch& operator=(const MessageBatch&) = delete;

    // What a message of `bytes` would add to what is kept of its kind.
    std::size_t growthBy(AudioEventCategory category, AudioEventType type, std::size_t bytes);
    // Accepts the message unless it is redundant. True when it was.
    [[nodiscard]] bool addUnlessRedundant(AudioEventCategory category, AudioEventType type,
                                          const Dictionary& message);

    // Requires that the message added last was redundant. Counts it among the repeats
    // of its kind; what these were before, when they bore other numbers of one name.
    std::optional<platform::Repeats> noteRepeat(AudioEventCategory category, AudioEventType type,
                                                double time);
    // The repeats of the last added message's kind, which are over if it was accepted.
    std::optional<platform::Repeats> takeRepeats();
    // Those of all kinds.
    std::vector<platform::Repeats> takeAllRepeats();

    bool empty() const { return summary_.empty(); }
    // 0 for a base identifier that has not been seen.
    std::uint32_t countFor(std::string_view base) const;
    // In the order of acceptance; empty unless the batch keeps messages.
    const std::vector<Entry>& entries() const { return entries_; }

    const std::vector<Dictionary>& volumeEvents() const { return volumes_.events(); }
    // Hands the summary over: asked again it starts anew.
    std::optional<Dictionary> takeSummary(AudioServiceType serviceType) {
        summary_.omit(volumes_.takeOmitted());
        return summary_.finish(serviceType);
    }

private:
    struct Kind {
        std::uint32_t count = 0;
        Dictionary last;       // the newest accepted message
        bool lastKept = false; // There was room for it; else nothing repeats it.
        platform::Allotment room;
        platform::Repeats repeats;
    };

    using Kinds = std::map<std::string, Kind, std::less<>>;

    // The kind of these, and whether it was there before.
    std::pair<Kinds::iterator, bool> kindOf(AudioEventCategory category, AudioEventType type);
    // Who pays for what the message at hand leaves.
    const platform::ClientBudgetPtr& sender() const;
    void keepLast(Kind& kind, const Dictionary& message);
    void keepEntry(const std::string& base, const Kind& kind, const Dictionary& message);

    const bool keepsMessages_;
    const platform::ClientBudgetPtr owner_;
    // Bounded by the names that categories and types can have (a few thousand).
    Kinds kinds_;
    // The newest message's: the next one is often of the same.
    Kinds::iterator lastKind_ = kinds_.end();
    AudioEventCategory lastCategory_ = 0;
    AudioEventType lastType_ = 0;
    std::vector<Entry> entries_;
    std::vector<platform::Allotment> entriesRoom_;
    VolumeStretches volumes_;
    SummaryTexts summary_;
};

// Whether two messages are equal but for "processuptime_ms", "systemuptime_sec"
// and "hyreporting_timestamp".
[[nodiscard]] bool equalButForTimeStamps(const Dictionary& left, const Dictionary& right);

} // namespace halyard
