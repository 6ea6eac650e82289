#include "content/SessionBook.h"

namespace halyard::exporting {

std::vector<std::string> applicationNames(const reading::SessionNames& names,
                                          std::string_view json) {
    std::vector<std::string> all;
    const auto take = [&all](std::optional<std::string_view> name) {
        // The name of who gave none is nobody's.
        if (name && !name->empty() && *name != "Unknown") {
            all.emplace_back(*name);
        }
    };
    take(names.application);
    reading::JsonFields fields;
    if (fields.parse(json)) {
        for (const char* const key : {"HostApplicationDisplayID", "ApplicationName", "rtaid_client",
                                      "application_binary", "processName"}) {
            take(fields.text(key));
        }
    }
    return all;
}

const char* sessionColumns(reading::StoreReader& reader) {
    return reader.hasColumn("upload_session", "ended") ? SessionBook::kColumns
                                                       : SessionBook::kColumnsBefore;
}

BookedSession SessionBook::read(const reading::Row& row) {
    enum Column : int { kID, kSession, kSessionInfo, kUserInfo, kOpened, kClosedAt, kEnded };
    BookedSession session;
    session.row = row.integer(kID);
    session.sessionID = row.maybeInteger(kSession);
    session.opened = row.real(kOpened);
    session.closed = row.maybeReal(kClosedAt);
    session.ended = row.text(kEnded);
    session.names = reading::namesIn(fields_, row.text(kSessionInfo), row.text(kUserInfo));
    session.userInfo = row.text(kUserInfo);
    session.trace = identity_.traceOf(session.row, session.opened);
    session.span = identity_.spanOf(session.row, session.opened);
    return session;
}

const BookedSession* SessionBook::find(reading::StoreReader& reader, std::int64_t row) {
    auto found = known_.find(row);
    if (found == known_.end()) {
        if (known_.size() >= kMostKnown) {
            known_.clear();
        }
        (void)reader.forEach({"upload_session", sessionColumns(reader), "", row - 1,
                              row > INT64_MAX - kAhead ? row : row + kAhead - 1},
                             [this](const reading::Row& each) {
                                 known_.insert_or_assign(each.integer(0), read(each));
                                 return true;
                             });
        found = known_.try_emplace(row).first;
    }
    return found->second ? &*found->second : nullptr;
}

} // namespace halyard::exporting
