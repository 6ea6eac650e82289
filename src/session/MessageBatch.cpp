#include "session/MessageBatch.h"

#include <algorithm>
#include <array>

namespace halyard {
namespace {

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
        if (!isError && equalButForTimeStamps(message, kind->second.last)) {
            return true;
        }
    }
    kind->second.count += 1;
    kind->second.last = message;
    if (keepsMessages_) {
        entries_.push_back({&kind->first, kind->second.count, message});
    }
    volumes_.take(message);
    summary_.take(message);
    return false;
}

std::uint32_t MessageBatch::countFor(std::string_view base) const {
    const auto kind = kinds_.find(base);
    return kind != kinds_.end() ? kind->second.count : 0;
}

} // namespace halyard
