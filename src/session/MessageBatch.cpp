#include "session/MessageBatch.h"

#include <algorithm>
#include <array>

#include "common/ValueSize.h"

namespace halyard {
namespace {

constexpr std::size_t kKindBytes = 256; // beside the message

constexpr std::array<std::string_view, 3> kComparisonExcludedKeys = {
    "processuptime_ms", "systemuptime_sec", "hyreporting_timestamp"};

bool isExcluded(std::string_view key) {
    return std::find(kComparisonExcludedKeys.begin(), kComparisonExcludedKeys.end(), key) !=
           kComparisonExcludedKeys.end();
}

std::size_t countCompared(const Dictionary& message) {
    return static_cast<std::size_t>(
        std::count_if(message.begin(), message.end(),
                      [](const auto& entry) { return !isExcluded(entry.key.text()); }));
}

} // namespace

bool equalButForTimeStamps(const Dictionary& left, const Dictionary& right) {
    std::size_t position = 0;
    std::size_t compared = 0;
    for (const auto& entry : left) {
        const std::size_t here = position++;
        if (isExcluded(entry.key.text())) {
            continue;
        }
        ++compared;
        // Messages of one kind carry their keys in one order: try that first.
        const Value* counterpart = here < right.size() && (right.begin() + here)->key == entry.key
                                       ? &(right.begin() + here)->value
                                       : right.find(entry.key.text());
        if (counterpart == nullptr || !(entry.value == *counterpart)) {
            return false;
        }
    }
    return compared == countCompared(right);
}

std::pair<MessageBatch::Kinds::iterator, bool> MessageBatch::kindOf(AudioEventCategory category,
                                                                    AudioEventType type) {
    if (lastKind_ != kinds_.end() && lastCategory_ == category && lastType_ == type) {
        return {lastKind_, true};
    }
    std::string base;
    appendCategoryString(base, category);
    base += '_';
    base += HYReportingUtilityTypeString(type);
    const auto [kind, isNew] = kinds_.try_emplace(std::move(base));
    lastKind_ = kind;
    lastCategory_ = category;
    lastType_ = type;
    return {kind, !isNew};
}

bool MessageBatch::addUnlessRedundant(AudioEventCategory category, AudioEventType type,
                                      const Dictionary& message) {
    const auto [kind, known] = kindOf(category, type);
    if (known) {
        const bool isError = category == kAudioEventCategoryError || type == kAudioEventTypeError;
        if (!isError && kind->second.lastKept &&
            equalButForTimeStamps(message, kind->second.last)) {
            return true;
        }
    }
    kind->second.count += 1;
    keepLast(kind->second, message);
    if (keepsMessages_) {
        keepEntry(kind->first, kind->second, message);
    }
    volumes_.take(message);
    summary_.take(message, sender());
    return false;
}

const platform::ClientBudgetPtr& MessageBatch::sender() const {
    const auto& current = platform::ClientBudget::current();
    return current != nullptr ? current : owner_;
}

std::size_t MessageBatch::growthBy(AudioEventCategory category, AudioEventType type,
                                   std::size_t bytes) {
    const std::size_t kept = kindOf(category, type).first->second.room.bytes();
    return kKindBytes + bytes > kept ? kKindBytes + bytes - kept : 0;
}

void MessageBatch::keepLast(Kind& kind, const Dictionary& message) {
    const std::size_t bytes = kKindBytes + bytesOf(message);
    if (!kind.room.isOf(sender())) {
        kind.room = platform::Allotment(sender());
    }
    kind.lastKept = kind.room.resize(bytes);
    kind.last = kind.lastKept ? message : Dictionary();
}

// One that finds no room is missing in the file of internal builds, and nowhere else.
void MessageBatch::keepEntry(const std::string& base, const Kind& kind, const Dictionary& message) {
    platform::Allotment room(sender());
    if (room.resize(sizeof(Entry) + bytesOf(message))) {
        entries_.push_back({&base, kind.count, message});
        entriesRoom_.push_back(std::move(room));
    }
}

std::optional<platform::Repeats> MessageBatch::noteRepeat(AudioEventCategory category,
                                                          AudioEventType type, double time) {
    platform::Repeats& repeats = lastKind_->second.repeats;
    std::optional<platform::Repeats> others;
    if (repeats.count > 0 && (repeats.category != category || repeats.type != type)) {
        others = takeRepeats();
    }
    if (repeats.count == 0) {
        repeats = {category, type, 0, time, time};
    }
    ++repeats.count;
    repeats.last = time;
    return others;
}

std::optional<platform::Repeats> MessageBatch::takeRepeats() {
    platform::Repeats& repeats = lastKind_->second.repeats;
    return repeats.count > 0 ? std::optional(std::exchange(repeats, {})) : std::nullopt;
}

std::vector<platform::Repeats> MessageBatch::takeAllRepeats() {
    std::vector<platform::Repeats> all;
    for (auto& [base, kind] : kinds_) {
        if (kind.repeats.count > 0) {
            all.push_back(std::exchange(kind.repeats, {}));
        }
    }
    return all;
}

std::uint32_t MessageBatch::countFor(std::string_view base) const {
    const auto kind = kinds_.find(base);
    return kind != kinds_.end() ? kind->second.count : 0;
}

} // namespace halyard
