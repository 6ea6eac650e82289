// What a session derives from the messages it accepts, for the time when it
// stops: a volume event for each stretch of playback at one volume, and one
// summary of all that was said.
//
// Both are followed message by message, while the message is at hand, rather
// than worked out from a batch at the end: a long session then stops at once,
// and need not keep its messages for it.
//
// Not thread-safe: the session locks them with its batch.
#pragma once

#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"

namespace halyard {

inline constexpr std::string_view HYReportingMessageKeySelectedFormat = "session_selected_format";
inline constexpr std::string_view HYReportingMessageKeyActiveDevices = "active_devices";
inline constexpr std::string_view HYReportingMessageKeyVolumeProcess =
    "VQSessionVolumeOperationProcess";
inline constexpr std::string_view HYReportingMessageKeyVolume = "VQSessionVolume";
inline constexpr std::string_view HYReportingMessageKeyPlayingState = "VQSessionVolumePlayingState";
inline constexpr std::string_view HYReportingMessageKeyHYTimestamp = "hyreporting_timestamp";

// One event for each stretch that lasted longer than `minimumPlaytime` seconds.
// A stretch that still plays at the end has none: nothing says when it ended.
// Format, devices and process are those seen last before its end.
class VolumeStretches {
public:
    explicit VolumeStretches(double minimumPlaytime) : minimumPlaytime_(minimumPlaytime) {}

    void take(const Dictionary& message);
    const std::vector<Dictionary>& events() const { return events_; }

private:
    void takeVolume(const Value& volume, const Dictionary& message);
    void endStretch(double length);

    const double minimumPlaytime_;
    Value format_{"Unknown"};
    Value devices_{"Unknown"};
    Value process_{"Unknown"};
    Value lastVolume_{-1};
    Value startTime_; // none while nothing plays
    std::vector<Dictionary> events_;
};

// Every key with all its values, in the order in which they came, joined by ",".
// The texts grow as the values come; nothing else of a message is kept.
class SummaryTexts {
public:
    void take(const Dictionary& message);
    bool empty() const { return messages_ == 0; }
    // Hands the texts over; what is taken later starts anew. None when nothing
    // has been taken.
    std::optional<Dictionary> finish(AudioServiceType serviceType);

private:
    struct Joined {
        // Where the next value's text is to be appended.
        std::string& end();
        // The whole text, which it lets go of.
        std::string take();

        Value key;
        // Full ones stay as they are: one string that grows for hours would be
        // moved to twice the room over and over.
        std::vector<std::string> blocks;
    };

    Joined& joinedFor(const Value& key, std::size_t place);

    std::deque<Joined> joined_; // Stays in place: positions_ looks into the keys.
    std::unordered_map<std::string_view, Joined*> positions_;
    // Messages of one kind carry their keys in one order: what stood at each
    // place of the last message.
    std::vector<Joined*> lastAtPlace_;
    std::size_t messages_ = 0;
};

} // namespace halyard
