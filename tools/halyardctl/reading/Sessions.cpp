#include "reading/Sessions.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

#include "common/HYReportingUtility.h"
#include "reading/SessionTotals.h"

namespace halyard::reading {
namespace {

// As many sessions as are told of in one pass over the messages.
constexpr std::size_t kGroup = 8192;
// Messages are taken up before the session is closed, and about when it is opened.
constexpr double kMargin = 2;

constexpr std::string_view kSuffix = "_session";

// In the order of the columns that forEachSession asks for.
SessionRow sessionOf(const Row& row, JsonFields& fields, bool hasEnded) {
    SessionRow session;
    SessionNames names = namesIn(fields, row.text(2), row.text(3));
    session.id = row.integer(0);
    session.sessionID = row.maybeInteger(1);
    session.application = std::move(names.application);
    session.service = std::move(names.service);
    session.direction = names.direction;
    session.opened = row.maybeReal(4);
    session.closed = row.maybeReal(5);
    if (hasEnded && !row.isNull(6)) {
        session.ended = std::string(row.text(6));
    }
    return session;
}

std::string conditionOf(const TimeRange& range) {
    std::string sql = "1";
    if (std::isfinite(range.since)) {
        sql += fmt::format(" AND (closed IS NULL OR closed >= {})", range.since);
    }
    if (std::isfinite(range.until)) {
        sql += fmt::format(" AND opened < {}", range.until);
    }
    return sql;
}

// Sessions that wait for the pass over their messages.
class Group {
public:
    Group(StoreReader& reader, const TimeRange& range, double now)
        : reader_(reader), range_(range), now_(now) {}

    void add(SessionRow&& row) {
        Session session;
        static_cast<SessionRow&>(session) = std::move(row);
        sessions_.push_back(std::move(session));
    }
    bool isFull() const { return sessions_.size() >= kGroup; }

    Outcome<void> tell(const std::function<bool(const Session&)>& take, bool& more) {
        if (sessions_.empty()) {
            return {};
        }
        const auto ids = reader_.idsIn(messageTimes(), "upload_message", "time");
        if (!ids.ok()) {
            return ids.failure();
        }
        SessionTotals totals(sessions_, range_);
        const auto read = totals.read(reader_, ids.value());
        if (!read.ok()) {
            return read;
        }
        totals.finish(reader_.isLive() && reader_.schema() > 1 ? std::optional(now_)
                                                               : std::nullopt);
        for (const Session& session : sessions_) {
            more = more && take(session);
        }
        sessions_.clear();
        return {};
    }

private:
    TimeRange messageTimes() const {
        TimeRange times{std::numeric_limits<double>::infinity(),
                        -std::numeric_limits<double>::infinity()};
        const TimeRange all;
        for (const Session& session : sessions_) {
            times.since = std::min(times.since, session.opened.value_or(all.since) - kMargin);
            times.until = std::max(times.until, session.closed.value_or(all.until) + kMargin);
        }
        return times;
    }

    StoreReader& reader_;
    const TimeRange range_;
    const double now_;
    std::vector<Session> sessions_;
};

} // namespace

const char* nameOf(Direction direction) {
    switch (direction) {
    case Direction::Playback:
        return "playback";
    case Direction::Capture:
        return "capture";
    case Direction::Unknown:
        break;
    }
    return nullptr;
}

SessionNames namesIn(JsonFields& fields, std::string_view sessionInfo, std::string_view userInfo) {
    SessionNames names;
    const auto textOf = [&fields](const char* key) {
        const auto found = fields.text(key);
        return found ? std::optional<std::string>(*found) : std::nullopt;
    };
    if (fields.parse(userInfo)) {
        names.application = textOf("HostApplicationDisplayID");
        names.service = textOf("kRelayReportingUserInfoServiceName");
        const auto direction = fields.text("stream_direction");
        names.direction = direction == "playback"  ? Direction::Playback
                          : direction == "capture" ? Direction::Capture
                                                   : Direction::Unknown;
    }
    if (!names.application && fields.parse(sessionInfo)) {
        names.application = textOf("kRelayReportingSessionInfoClientBundleID");
    }
    if (names.service && names.service->ends_with(kSuffix)) {
        names.service->resize(names.service->size() - kSuffix.size());
    }
    return names;
}

Outcome<void> forEachSession(StoreReader& reader, const TimeRange& range, double now,
                             const SessionFilter& wanted,
                             const std::function<bool(const Session&)>& take) {
    const bool hasEnded = reader.hasColumn("upload_session", "ended");
    JsonFields fields;
    Group group(reader, range, now);
    bool more = true;
    Outcome<void> told;
    const auto read =
        reader.forEach({"upload_session",
                        fmt::format("session_id, session_info, user_info, opened, closed{}",
                                    hasEnded ? ", ended" : ""),
                        conditionOf(range)},
                       [&](const Row& row) {
                           SessionRow session = sessionOf(row, fields, hasEnded);
                           if (!wanted || wanted(session)) {
                               group.add(std::move(session));
                           }
                           told = group.isFull() ? group.tell(take, more) : told;
                           return more && told.ok();
                       });
    if (!read.ok() || !told.ok()) {
        return !read.ok() ? read : told;
    }
    return more ? group.tell(take, more) : Outcome<void>();
}

const SessionNames& SessionDirectory::namesOf(std::int64_t row) {
    if (const auto found = known_.find(row); found != known_.end()) {
        return found->second;
    }
    if (known_.size() >= kMostKnown) {
        known_.clear();
    }
    SessionNames& names = known_[row];
    if (row > 0) {
        // One that cannot be read has no names; reading the rest will tell why.
        (void)reader_.forEach({"upload_session", "session_info, user_info", "", row - 1, row},
                              [&](const Row& found) {
                                  names = namesIn(fields_, found.text(1), found.text(2));
                                  return false;
                              });
    }
    return names;
}

} // namespace halyard::reading
