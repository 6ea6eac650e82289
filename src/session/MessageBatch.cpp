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
