#include "session/SessionEvents.h"

#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>

#include "common/Description.h"

namespace halyard {
namespace {

constexpr const char* kSummaryKey = "HY_Session_Summary_Event";
constexpr std::uint32_t kVolumeDigits = 4;

// Follows the batch from message to message.
class VolumeWalk {
public:
    explicit VolumeWalk(double minimumPlaytime) : minimumPlaytime_(minimumPlaytime) {}

    void take(const Dictionary& message) {
        remember(message, HYReportingMessageKeySelectedFormat, format_);
        remember(message, HYReportingMessageKeyActiveDevices, devices_);
        remember(message, HYReportingMessageKeyVolumeProcess, process_);
        if (const Value* volume = message.find(HYReportingMessageKeyVolume)) {
            takeVolume(*volume, message);
        }
    }

    std::vector<Dictionary> events;

private:
    static void remember(const Dictionary& message, std::string_view key, Value& last) {
        if (const Value* value = message.find(key)) {
            last = *value;
        }
    }

    void takeVolume(const Value& volume, const Dictionary& message) {
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

    void endStretch(double length) {
        if (!(length > minimumPlaytime_)) {
            return;
        }
        const auto volumeBucket = HYReportingUtilityBucketNumberToString(
            lastVolume_.doubleValue(), HYReportingUtilityBucketNumberToStringVolumes,
            kVolumeDigits);
        const auto lengthBucket = HYReportingUtilityBucketNumberToString(
            length, HYReportingUtilityBucketNumberToStringTimes, 0);
        events.push_back(Dictionary{{HYReportingMessageKeySelectedFormat, format_},
                                    {HYReportingMessageKeyActiveDevices, devices_},
                                    {HYReportingMessageKeyVolumeProcess, process_},
                                    {HYReportingMessageKeyVolume, lastVolume_},
                                    {"VQSessionVolumeBucketed", volumeBucket.value_or("")},
                                    {"play_seconds", static_cast<float>(length)},
                                    {"play_secondsBucketed", lengthBucket.value_or("")}});
    }

    const double minimumPlaytime_;
    Value format_{"Unknown"};
    Value devices_{"Unknown"};
    Value process_{"Unknown"};
    Value lastVolume_{-1};
    Value startTime_; // none while nothing plays
};

} // namespace

std::vector<Dictionary> createVolumeEvents(const std::vector<MessageBatch::Entry>& batch,
                                           double minimumPlaytime) {
    VolumeWalk walk(minimumPlaytime);
    for (const MessageBatch::Entry& entry : batch) {
        walk.take(entry.message);
    }
    return std::move(walk.events);
}

std::optional<Dictionary> createSummaryEvent(const std::vector<MessageBatch::Entry>& batch,
                                             AudioServiceType serviceType) {
    if (batch.empty()) {
        return std::nullopt;
    }
    struct Joined {
        Value key;
        std::string values;
    };
    std::vector<Joined> joined{{kSummaryKey, std::to_string(serviceType)}};
    // Views into the keys of the batch, which outlives them here.
    std::unordered_map<std::string_view, std::size_t> positions{{kSummaryKey, 0}};
    for (const MessageBatch::Entry& entry : batch) {
        for (const auto& [key, value] : entry.message) {
            const auto [position, isNew] = positions.try_emplace(key.text(), joined.size());
            if (isNew) {
                joined.push_back({key, describe(value)});
            } else {
                std::string& values = joined[position->second].values;
                values += ',';
                appendDescription(values, value);
            }
        }
    }
    std::vector<Dictionary::Entry> entries;
    entries.reserve(joined.size());
    for (Joined& each : joined) {
        entries.push_back({std::move(each.key), Value(each.values)});
        each.values = std::string(); // One long text at a time.
    }
    return Dictionary(std::move(entries));
}

} // namespace halyard
