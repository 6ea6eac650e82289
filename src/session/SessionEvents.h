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
#include <utility>
#include <vector>

#include "common/HYReportingUtility.h"
#include "common/Value.h"
#include "platform/ClientBudget.h"

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

    // Stretches beyond this many have no event.
    static constexpr std::size_t kMostEvents = 4096;

    void take(const Dictionary& message);
    const std::vector<Dictionary>& events() const { return events_; }
    // How many had none since this was asked.
    std::size_t takeOmitted() { return std::exchange(omitted_, 0); }

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
    std::size_t omitted_ = 0;
};

// Every key with all its values, in the order in which they came, joined by ",".
// The texts grow as the values come; nothing else of a message is kept.
//
// They grow up to a bound, and as far as the budgets of those who send allow. Values
// beyond are left out, and the summary says how many.
class SummaryTexts {
public:
    explicit SummaryTexts(std::size_t mostBytes) : mostBytes_(mostBytes) {}

    // `sender` pays; null: nobody.
    void take(const Dictionary& message, const platform::ClientBudgetPtr& sender);
    // What was left out elsewhere and belongs to the same number.
    void omit(std::size_t values) { omitted_ += values; }
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

    // Null when there is no room for another key.
    Joined* joinedFor(const Value& key, std::size_t place, const platform::ClientBudgetPtr& sender);
    // False when there is no room.
    bool appendShort(Joined& joined, const Value& value);
    bool append(Joined& joined, const Value& value, const platform::ClientBudgetPtr& sender);
    bool hasRoomFor(std::size_t bytes, const platform::ClientBudgetPtr& sender);

    std::deque<Joined> joined_; // Stays in place: positions_ looks into the keys.
    std::unordered_map<std::string_view, Joined*> positions_;
    // Messages of one kind carry their keys in one order: what stood at each
    // place of the last message.
    std::vector<Joined*> lastAtPlace_;
    std::string text_; // of the value at hand
    std::size_t messages_ = 0;
    std::size_t omitted_ = 0;

    std::size_t mostBytes_;
    std::size_t usedBytes_ = 0;
    std::size_t roomBytes_ = 0;
    std::vector<platform::Allotment> room_; // what senders have paid for
};

} // namespace halyard
