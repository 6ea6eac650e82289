#include "reading/SessionTotals.h"

#include <algorithm>
#include <cstring>
#include <iterator>

#include "common/HYReportingUtility.h"

namespace halyard::reading {
namespace {

using linux_::StoreStatement;

// A transaction takes some hundredths of a second for these.
constexpr std::int64_t kRowsAtOnce = 65'536;
constexpr const char* kPass =
    "SELECT max(id), count(*), sum(taken) FROM"
    " (SELECT id, CASE WHEN is_ours(upload_session)"
    " THEN take_row(category, type, time, payload) END AS taken"
    " FROM upload_message WHERE id > ?1 AND id <= ?2 ORDER BY id LIMIT ?3)";

// Nobody has more; a message that names thousands is not meant well.
constexpr std::size_t kMostDevices = 64;

// Without one of these a payload tells nothing of devices and stretches.
constexpr std::string_view kMarks[] = {"\"active_devices\"", "\"VQSessionVolumePlayingState\""};

bool hasMark(std::string_view payload) {
    return std::any_of(std::begin(kMarks), std::end(kMarks), [payload](std::string_view mark) {
        return ::memmem(payload.data(), payload.size(), mark.data(), mark.size()) != nullptr;
    });
}

bool mayTell(std::int64_t category, std::int64_t type) {
    switch (category) {
    case kAudioEventCategoryRecord:
    case kAudioEventCategoryPlayback:
    case kAudioEventCategoryPlaybackAndRecord:
    case kAudioEventCategoryRouteChange:
    case kAudioEventCategoryVolume:
        return type != kAudioEventTypeSummary;
    default:
        return false;
    }
}

// The functions that a pass calls, as long as it lasts.
class Functions {
public:
    using Function = void (*)(sqlite3_context*, int, sqlite3_value**);

    Functions(sqlite3* database, void* self, Function isOurs, Function takeRow)
        : database_(database) {
        set("is_ours", 1, self, isOurs);
        set("take_row", 4, self, takeRow);
    }
    ~Functions() {
        set("is_ours", 1, nullptr, nullptr);
        set("take_row", 4, nullptr, nullptr);
    }
    Functions(const Functions&) = delete;
    Functions& operator=(const Functions&) = delete;

private:
    void set(const char* name, int count, void* self, Function function) const {
        (void)sqlite3_create_function_v2(database_, name, count, SQLITE_UTF8 | SQLITE_DIRECTONLY,
                                         self, function, nullptr, nullptr, nullptr);
    }
    sqlite3* const database_;
};

} // namespace

SessionTotals::SessionTotals(std::vector<Session>& sessions, const TimeRange& range)
    : sessions_(sessions), range_(range), running_(sessions.size()) {}

Outcome<void> SessionTotals::read(StoreReader& reader, StoreReader::Ids ids) {
    const Functions functions(reader.handle(), this, isOurs, takeRow);
    StoreStatement pass;
    int code = pass.prepare(reader.handle(), kPass);
    for (std::int64_t rows = kRowsAtOnce; code == SQLITE_OK && rows == kRowsAtOnce;) {
        pass.bindFrom(1, ids.after, ids.upTo, kRowsAtOnce);
        code = pass.step();
        if (code == SQLITE_ROW) {
            ids.after = pass.integer(0);
            rows = pass.integer(1);
            pass.reset();
            code = SQLITE_OK;
        }
    }
    return code == SQLITE_OK ? Outcome<void>() : reader.troubleOf(code);
}

void SessionTotals::isOurs(sqlite3_context* answer, int, sqlite3_value** values) {
    auto* const self = static_cast<SessionTotals*>(sqlite3_user_data(answer));
    const bool known = sqlite3_value_type(values[0]) == SQLITE_INTEGER &&
                       self->find(sqlite3_value_int64(values[0]));
    sqlite3_result_int(answer, known ? 1 : 0);
}

void SessionTotals::takeRow(sqlite3_context* answer, int, sqlite3_value** values) {
    // As a blob, a text is not copied to get an end.
    const auto* const bytes = static_cast<const char*>(sqlite3_value_blob(values[3]));
    const auto size = static_cast<std::size_t>(sqlite3_value_bytes(values[3]));
    static_cast<SessionTotals*>(sqlite3_user_data(answer))
        ->take({sqlite3_value_int64(values[0]), sqlite3_value_int64(values[1]),
                sqlite3_value_double(values[2]),
                bytes == nullptr ? std::string_view() : std::string_view(bytes, size)});
    sqlite3_result_int(answer, 1);
}

bool SessionTotals::find(std::int64_t session) {
    const auto found =
        std::lower_bound(sessions_.begin(), sessions_.end(), session,
                         [](const Session& one, std::int64_t id) { return one.id < id; });
    if (found == sessions_.end() || found->id != session) {
        return false;
    }
    session_ = &*found;
    state_ = &running_[static_cast<std::size_t>(found - sessions_.begin())];
    return true;
}

void SessionTotals::take(const Message& message) {
    ++session_->messages;
    session_->lastHeard = message.time;
    state_->played = state_->played || message.category == kAudioEventCategoryPlayback;
    state_->captured = state_->captured || message.category == kAudioEventCategoryRecord;
    const bool isGlitch = message.type == kAudioEventTypeIssueDetector;
    const bool tells = mayTell(message.category, message.type) && hasMark(message.payload);
    if (!isGlitch && !tells) {
        return;
    }
    const bool readable = fields_.parse(message.payload);
    if (isGlitch) {
        takeGlitch(readable ? fields_.number("glitch_start") : std::nullopt);
    }
    if (tells && readable) {
        takeDevices();
        takePlayingState(fields_.number("hyreporting_timestamp").value_or(message.time));
    }
}

void SessionTotals::takeDevices() {
    fields_.forEachText("active_devices", [this](std::string_view device) {
        auto& known = session_->devices;
        if (device != "Unknown" && known.size() < kMostDevices &&
            std::find(known.begin(), known.end(), device) == known.end()) {
            known.emplace_back(device);
        }
    });
}

void SessionTotals::takePlayingState(double time) {
    const auto state = fields_.integer("VQSessionVolumePlayingState");
    if (!state) {
        return;
    }
    if (*state != 0) {
        state_->playingSince = state_->playingSince.value_or(time);
    } else if (state_->playingSince) {
        addStretch(*session_, *state_->playingSince, time);
        state_->playingSince.reset();
    }
}

// A glitch that lasts is told more than once, each time with the same start; one
// without a start is told once.
void SessionTotals::takeGlitch(std::optional<double> start) {
    if (!start || state_->glitchStarts.insert(*start).second) {
        ++session_->glitches;
    }
}

void SessionTotals::addStretch(Session& session, double from, double to) const {
    session.playedSeconds += std::max(0.0, to - from);
    session.playedInRange +=
        std::max(0.0, std::min(to, range_.until) - std::max(from, range_.since));
}

void SessionTotals::finish(std::optional<double> now) {
    for (std::size_t i = 0; i < sessions_.size(); ++i) {
        Session& session = sessions_[i];
        const Running& running = running_[i];
        if (session.direction == Direction::Unknown && running.played != running.captured) {
            session.direction = running.played ? Direction::Playback : Direction::Capture;
        }
        if (running.playingSince) {
            const double end = session.closed ? *session.closed : now.value_or(session.lastHeard);
            addStretch(session, *running.playingSince, end);
        }
    }
}

} // namespace halyard::reading
