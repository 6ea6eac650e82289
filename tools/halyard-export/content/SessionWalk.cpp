#include "content/SessionWalk.h"

#include <fmt/format.h>
#include <utility>

#include "content/TablePlace.h"

namespace halyard::exporting {
namespace {

using reading::Outcome;
using reading::Row;
using reading::StoreReader;

constexpr const char* kSessions = "upload_session";
// Open sessions that are asked for at a time.
constexpr std::size_t kAtATime = 256;

} // namespace

void SessionWalk::take(BookedSession session, SessionGroup& group) {
    if (session.closed) {
        group.closed.push_back(std::move(session));
    } else {
        group.change.opened.push_back(session.row);
    }
}

// Of those that are neither there nor open nobody will hear any more.
Outcome<void> SessionWalk::lookAt(const std::vector<std::int64_t>& open, StoreReader& reader,
                                  SessionGroup& group) {
    std::size_t next = 0;
    const auto passRemoved = [&](std::int64_t before) {
        for (; next < open.size() && open[next] < before; ++next) {
            ++group.change.losses[Loss::Removed];
            group.change.done.push_back(open[next]);
        }
    };
    const auto done = reader.forEach({kSessions, sessionColumns(reader),
                                      fmt::format("id IN ({})", fmt::join(open, ",")),
                                      open.front() - 1, open.back()},
                                     [&](const Row& row) {
                                         passRemoved(row.integer(0));
                                         ++next;
                                         if (row.maybeReal(SessionBook::kClosed)) {
                                             group.change.done.push_back(row.integer(0));
                                             group.closed.push_back(sessions_.read(row));
                                         }
                                         group.hasMore = group.closed.size() >= kMostSessions;
                                         return !group.hasMore;
                                     });
    if (!group.hasMore) {
        passRemoved(INT64_MAX);
    }
    return done;
}

Outcome<void> SessionWalk::lookAgain(Signal signal, StoreReader& reader, const ExportPlace& place,
                                     SessionGroup& group) {
    auto open = place.openSessions(signal, 0, kAtATime);
    while (!open.empty() && !group.hasMore) {
        if (auto looked = lookAt(open, reader, group); !looked.ok()) {
            return looked;
        }
        open = place.openSessions(signal, open.back(), kAtATime);
    }
    return {};
}

Outcome<void> SessionWalk::lookForLate(Signal signal, StoreReader& reader, const ExportPlace& place,
                                       SessionGroup& group) {
    for (const LateRows& late : place.lateRows(signal, kSessions)) {
        Position position = late.after;
        const auto done =
            reader.forEach({kSessions, sessionColumns(reader), "", position.id, late.before - 1},
                           [&](const Row& row) {
                               group.hasMore =
                                   group.hasMore || group.closed.size() >= kMostSessions;
                               if (group.closed.size() >= kMostSessions) {
                                   return false;
                               }
                               BookedSession session = sessions_.read(row);
                               position = {session.row, session.opened};
                               take(std::move(session), group);
                               return true;
                           });
        if (!done.ok()) {
            return done.failure();
        }
        if (position != late.after) {
            group.change.late[{kSessions, late.before}] = position;
        }
    }
    return {};
}

Outcome<void> SessionWalk::goOn(Signal signal, StoreReader& reader, const ExportPlace& place,
                                SessionGroup& group) {
    const Position before = place.positionOf(signal, kSessions);
    const auto start = startIn(reader, kSessions, "opened", before);
    if (!start.ok()) {
        return start.failure();
    }
    Position position = start.value();
    const auto done =
        reader.forEach({kSessions, sessionColumns(reader), "", position.id}, [&](const Row& row) {
            if (group.closed.size() >= kMostSessions || group.change.opened.size() >= kMostOpen) {
                group.hasMore = true;
                return false;
            }
            BookedSession session = sessions_.read(row);
            passTo(position, kSessions, {session.row, session.opened}, consent_, group.change);
            take(std::move(session), group);
            return true;
        });
    if (position != before) {
        group.change.positions[kSessions] = position;
    }
    return done;
}

Outcome<SessionGroup> SessionWalk::next(Signal signal, StoreReader& reader,
                                        const ExportPlace& place) {
    SessionGroup group;
    for (const auto look :
         {&SessionWalk::lookAgain, &SessionWalk::lookForLate, &SessionWalk::goOn}) {
        if (auto done = (this->*look)(signal, reader, place, group); !done.ok()) {
            return done.failure();
        }
    }
    // Those from a time without consent are passed, and leave nothing.
    std::erase_if(group.closed, [this](const BookedSession& session) {
        return !consent_.isGivenAt(session.opened) ||
               !consent_.isGivenAt(session.closed.value_or(session.opened));
    });
    return group;
}

} // namespace halyard::exporting
