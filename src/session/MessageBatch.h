// The accepted messages of a running session, in the order of acceptance, and
// the rule that keeps repeats out.
//
// Each message bears the identifier Category_Type_N, N counting from 1 for each
// "Category_Type". A message is redundant when it equals the message accepted
// last under the same "Category_Type" in everything but its time stamps. That
// one is found through an index, so that the cost of a message does not grow
// with the batch; the identifier's text is built only where somebody reads it.
//
// Not thread-safe: the session locks it.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"

namespace halyard {

class MessageBatch {
public:
    struct Entry {
        const std::string* base; // "Category_Type"; owned by the batch
        std::uint32_t count;
        Dictionary message;

        std::string identifier() const { return *base + '_' + std::to_string(count); }
    };

    MessageBatch() = default;
    MessageBatch(const MessageBatch&) = delete; // entries point into kinds_
    MessageBatch& operator=(const MessageBatch&) = delete;

    // Appends the message unless it is redundant. True when it was.
    [[nodiscard]] bool addUnlessRedundant(AudioEventCategory category, AudioEventType type,
                                          const Dictionary& message);

    const std::vector<Entry>& entries() const { return entries_; }
    bool empty() const { return entries_.empty(); }
    // 0 for a base identifier that has not been seen.
    std::uint32_t countFor(std::string_view base) const;

private:
    struct Kind {
        std::uint32_t count = 0;
        std::size_t last = 0; // index of the newest entry of this kind
    };

    std::vector<Entry> entries_;
    // Bounded by the names that categories and types can have (a few thousand).
    std::map<std::string, Kind, std::less<>> kinds_;
};

// Whether two messages are equal but for "processuptime_ms", "systemuptime_sec"
// and "hyreporting_timestamp".
[[nodiscard]] bool equalButForTimeStamps(const Dictionary& left, const Dictionary& right);

} // namespace halyard
