#include "session/SessionEvents.h"

#include <algorithm>
#include <utility>

#include "common/Description.h"

namespace halyard {
namespace {

constexpr const char* kSummaryKey = "HY_Session_Summary_Event";
constexpr const char* kOmittedKey = "HY_Session_Summary_Omitted";
// What a key takes beside its letters and its values.
constexpr std::size_t kKeyBytes = 256;
constexpr std::size_t kLeastPortion = 1024;
constexpr std::size_t kLongestNumber = 40;
constexpr std::uint32_t kVolumeDigits = 4;
constexpr std::size_t kBlockBytes = 32 * 1024;
constexpr std::size_t kBlockSlack = 256; // most values fit into it

} // namespace

void VolumeStretches::take(const Dictionary& message) {
    const Value* volume = nullptr;
    for (const auto& [name, value] : message) {
        const std::string_view key = name.text();
        if (key == HYReportingMessageKeyVolume) {
            volume = &value;
        } else if (key == HYReportingMessageKeySelectedFormat) {
            format_ = value.detached();
        } else if (key == HYReportingMessageKeyActiveDevices) {
            devices_ = value.detached();
        } else if (key == HYReportingMessageKeyVolumeProcess) {
            process_ = value.detached();
        }
    }
    if (volume != nullptr) {
        takeVolume(*volume, message);
    }
}

void VolumeStretches::takeVolume(const Value& volume, const Dictionary& message) {
    const bool playing = message[HYReportingMessageKeyPlayingState].integerValue() != 0;
    const Value& time = message[HYReportingMessageKeyHYTimestamp];
    if (startTime_.isNone()) {
        startTime_ = playing ? time.detached() : Value();
    } else if (!playing || volume.doubleValue() != lastVolume_.doubleValue()) {
        endStretch(time.doubleValue() - startTime_.doubleValue());
        startTime_ = playing ? time.detached() : Value();
    }
    lastVolume_ = volume.detached();
}

void VolumeStretches::endStretch(double length) {
    if (!(length > minimumPlaytime_)) {
        return;
    }
    if (events_.size() == kMostEvents) {
        ++omitted_;
        return;
    }
    const auto volumeBucket = HYReportingUtilityBucketNumberToString(
        lastVolume_.doubleValue(), HYReportingUtilityBucketNumberToStringVolumes, kVolumeDigits);
    const auto lengthBucket = HYReportingUtilityBucketNumberToString(
        length, HYReportingUtilityBucketNumberToStringTimes, 0);
    events_.push_back(Dictionary{{HYReportingMessageKeySelectedFormat, format_},
                                 {HYReportingMessageKeyActiveDevices, devices_},
                                 {HYReportingMessageKeyVolumeProcess, process_},
                                 {HYReportingMessageKeyVolume, lastVolume_},
                                 {"VQSessionVolumeBucketed", volumeBucket.value_or("")},
                                 {"play_seconds", static_cast<float>(length)},
                                 {"play_secondsBucketed", lengthBucket.value_or("")}});
}

std::string& SummaryTexts::Joined::end() {
    if (blocks.empty()) {
        return blocks.emplace_back();
    }
    blocks.back() += ','; // An empty text is a value, too.
    if (blocks.back().size() >= kBlockBytes) {
        blocks.emplace_back().reserve(kBlockBytes + kBlockSlack);
    }
    return blocks.back();
}

std::string SummaryTexts::Joined::take() {
    std::size_t size = 0;
    for (const std::string& block : blocks) {
        size += block.size();
    }
    std::string text;
    text.reserve(size);
    for (std::string& block : blocks) {
        text += block;
        block = std::string(); // One long text at a time.
    }
    return text;
}

// Room is taken in portions that grow with what there is, so that a value costs no
// atomic operation.
bool SummaryTexts::hasRoomFor(std::size_t bytes, const platform::ClientBudgetPtr& sender) {
    if (usedBytes_ + bytes > mostBytes_) {
        return false;
    }
    if (usedBytes_ + bytes > roomBytes_) {
        const std::size_t missing = usedBytes_ + bytes - roomBytes_;
        platform::Allotment portion(sender);
        if (!portion.resize(std::max({missing, kLeastPortion, roomBytes_ / 8})) &&
            !portion.resize(missing)) {
            return false;
        }
        roomBytes_ += portion.bytes();
        room_.push_back(std::move(portion));
    }
    usedBytes_ += bytes;
    return true;
}

SummaryTexts::Joined* SummaryTexts::joinedFor(const Value& key, std::size_t place,
                                              const platform::ClientBudgetPtr& sender) {
    if (place >= lastAtPlace_.size()) {
        lastAtPlace_.resize(place + 1);
    }
    Joined*& guess = lastAtPlace_[place];
    if (guess != nullptr && guess->key == key) {
        return guess;
    }
    if (const auto known = positions_.find(key.text()); known != positions_.end()) {
        guess = known->second;
    } else if (!hasRoomFor(kKeyBytes + key.text().size(), sender)) {
        return nullptr;
    } else {
        guess = &joined_.emplace_back(Joined{key.detached(), {}});
        positions_.emplace(guess->key.text(), guess);
    }
    return guess;
}

void SummaryTexts::take(const Dictionary& message, const platform::ClientBudgetPtr& sender) {
    ++messages_;
    std::size_t place = 0;
    for (const auto& [key, value] : message) {
        Joined* const joined = joinedFor(key, place++, sender);
        if (joined == nullptr || !(appendShort(*joined, value) || append(*joined, value, sender))) {
            ++omitted_;
        }
    }
    if (text_.capacity() > kBlockBytes) {
        text_ = std::string();
    }
}

// Most values: those that are known to find room before their text is made.
bool SummaryTexts::appendShort(Joined& joined, const Value& value) {
    const std::size_t most = value.isNumber() ? kLongestNumber : value.text().size();
    if ((most == 0 && !value.isString()) || usedBytes_ + most >= roomBytes_) {
        return false;
    }
    std::string& text = joined.end();
    const std::size_t before = text.size();
    appendDescription(text, value);
    usedBytes_ += text.size() - before + 1;
    return true;
}

bool SummaryTexts::append(Joined& joined, const Value& value,
                          const platform::ClientBudgetPtr& sender) {
    text_.clear();
    appendDescription(text_, value);
    if (!hasRoomFor(text_.size() + 1, sender)) {
        return false;
    }
    joined.end() += text_;
    return true;
}

std::optional<Dictionary> SummaryTexts::finish(AudioServiceType serviceType) {
    if (empty()) {
        return std::nullopt;
    }
    std::vector<Dictionary::Entry> entries;
    entries.reserve(joined_.size() + 1);
    entries.push_back({kSummaryKey, std::to_string(serviceType)});
    for (Joined& each : joined_) {
        if (each.key.text() == kSummaryKey) {
            entries.front().value = std::to_string(serviceType) + ',' + each.take();
        } else {
            entries.push_back({std::move(each.key), Value(each.take())});
        }
    }
    if (omitted_ > 0) {
        entries.push_back({kOmittedKey, std::to_string(omitted_)});
    }
    *this = SummaryTexts(mostBytes_);
    return Dictionary(std::move(entries));
}

} // namespace halyard
