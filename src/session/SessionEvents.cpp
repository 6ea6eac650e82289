#include "session/SessionEvents.h"

#include <utility>

#include "common/Description.h"

namespace halyard {
namespace {

constexpr const char* kSummaryKey = "HY_Session_Summary_Event";
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
            format_ = value;
        } else if (key == HYReportingMessageKeyActiveDevices) {
            devices_ = value;
        } else if (key == HYReportingMessageKeyVolumeProcess) {
            process_ = value;
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
        startTime_ = playing ? time : Value();
    } else if (!playing || volume.doubleValue() != lastVolume_.doubleValue()) {
        endStretch(time.doubleValue() - startTime_.doubleValue());
        startTime_ = playing ? time : Value();
    }
    lastVolume_ = volume;
}

void VolumeStretches::endStretch(double length) {
    if (!(length > minimumPlaytime_)) {
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

SummaryTexts::Joined& SummaryTexts::joinedFor(const Value& key, std::size_t place) {
    if (place >= lastAtPlace_.size()) {
        lastAtPlace_.resize(place + 1);
    }
    Joined*& guess = lastAtPlace_[place];
    if (guess != nullptr && guess->key == key) {
        return *guess;
    }
    if (const auto known = positions_.find(key.text()); known != positions_.end()) {
        guess = known->second;
    } else {
        guess = &joined_.emplace_back(Joined{key, {}});
        positions_.emplace(guess->key.text(), guess);
    }
    return *guess;
}

void SummaryTexts::take(const Dictionary& message) {
    ++messages_;
    std::size_t place = 0;
    for (const auto& [key, value] : message) {
        appendDescription(joinedFor(key, place++).end(), value);
    }
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
    *this = SummaryTexts();
    return Dictionary(std::move(entries));
}

} // namespace halyard
