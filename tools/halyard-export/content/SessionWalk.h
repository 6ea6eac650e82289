// Goes through the upload sessions in their order, and comes back for those that were open.
//
// Each signal goes its own way. Sessions are few beside messages, so each that was passed
// while it was open is looked at again, a group at a time. Not thread-safe.
#pragma once

#include <cstdint>
#include <vector>

#include "content/ConsentHistory.h"
#include "content/SessionBook.h"
#include "place/ExportPlace.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

// What was met on the way.
struct SessionGroup {
    std::vector<BookedSession> closed; // and agreed to
    PlaceChange change;
    bool hasMore = false;
};

class SessionWalk {
public:
    // Of one group.
    static constexpr std::size_t kMostSessions = 64;
    // Open sessions that are passed for one group.
    static constexpr std::size_t kMostOpen = 8192;

    // Borrows both.
    SessionWalk(SessionBook& sessions, const ConsentHistory& consent)
        : sessions_(sessions), consent_(consent) {}

    // The same again until what changed about the place is committed.
    reading::Outcome<SessionGroup> next(Signal signal, reading::StoreReader& reader,
                                        const ExportPlace& place);

private:
    reading::Outcome<void> lookAt(const std::vector<std::int64_t>& open,
                                  reading::StoreReader& reader, SessionGroup& group);
    reading::Outcome<void> lookAgain(Signal signal, reading::StoreReader& reader,
                                     const ExportPlace& place, SessionGroup& group);
    reading::Outcome<void> lookForLate(Signal signal, reading::StoreReader& reader,
                                       const ExportPlace& place, SessionGroup& group);
    reading::Outcome<void> goOn(Signal signal, reading::StoreReader& reader,
                                const ExportPlace& place, SessionGroup& group);
    static void take(BookedSession session, SessionGroup& group);

    SessionBook& sessions_;
    const ConsentHistory& consent_;
};

} // namespace halyard::exporting
