// The upload sessions that rows belong to, by their rows.
//
// Keeps a few thousand, so that the rows of a session do not each ask for it. Not
// thread-safe.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "content/Identity.h"
#include "reading/Sessions.h"

namespace halyard::exporting {

struct BookedSession {
    std::int64_t row = 0;
    std::optional<std::int64_t> sessionID;
    double opened = 0;
    std::optional<double> closed;
    std::string ended; // empty while it is open, or unknown
    reading::SessionNames names;
    std::string userInfo;
    TraceID trace{};
    SpanID span{};
};

// All names of the application in a session's or single message's names and user info, or
// in the payload of an event.
std::vector<std::string> applicationNames(const reading::SessionNames& names,
                                          std::string_view json);

class SessionBook {
public:
    // What it reads of a row, after the id.
    static constexpr const char* kColumns =
        "session_id, session_info, user_info, opened, closed, ended";
    static constexpr int kClosed = 5; // of them, with the id
    // In a store of version 1.
    static constexpr const char* kColumnsBefore =
        "session_id, session_info, user_info, opened, closed, NULL";

    explicit SessionBook(const Identity& identity) : identity_(identity) {}

    BookedSession read(const reading::Row& row);

    // Null when there is none. Valid until the next call.
    const BookedSession* find(reading::StoreReader& reader, std::int64_t row);
    void forget() { known_.clear(); }

private:
    static constexpr std::size_t kMostKnown = 4096;
    // Sessions that are read at a time: messages rise with them.
    static constexpr std::int64_t kAhead = 8;

    const Identity& identity_;
    reading::JsonFields fields_;
    std::unordered_map<std::int64_t, std::optional<BookedSession>> known_;
};

// The columns that `reader`'s store has of a session.
const char* sessionColumns(reading::StoreReader& reader);

} // namespace halyard::exporting
