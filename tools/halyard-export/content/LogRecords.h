// Rows of the store as log records.
//
// What records of a session have alike comes first, then the texts of the payload, then what
// differs from one to the next: compressed, that takes a tenth less. Not thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "content/ConsentHistory.h"
#include "content/Identity.h"
#include "content/PayloadAttributes.h"
#include "content/SessionBook.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

// A table whose rows become log records.
struct LogTable {
    std::string_view name;
    const char* columns; // after the id; the time is the last
};
inline constexpr std::array<LogTable, 4> kLogTables = {{
    {"upload_message", "upload_session, session_info, user_info, category, type, payload, time"},
    {"incident", "signature, report, time"},
    {"energy_event", "client, name, payload, time"},
    {"analytics_event", "name, payload, time"},
}};
// Which of them repeats the messages.
inline constexpr std::size_t kAnalyticsEvents = 3;

// When a row of such a table was made.
double timeOf(std::size_t table, const reading::Row& row);

class LogRecords {
public:
    // Borrows all.
    LogRecords(const Identity& identity, const Omission& omission, const ConsentHistory& consent,
               SessionBook& sessions)
        : identity_(identity), omission_(omission), consent_(consent), sessions_(sessions),
          payload_(omission) {}

    struct Record {
        std::string_view event; // its name
        std::string_view bytes; // an encoded LogRecord
    };
    // Of a row of kLogTables[table]. Valid until the next call. `reader` is for what belongs
    // to it.
    Record recordOf(reading::StoreReader& reader, std::size_t table, const reading::Row& row);

    // Sessions are looked up again.
    void forget();

private:
    void forgetSession();
    void begin(std::string_view event, int severity);
    void end(std::size_t table, const reading::Row& row);
    void addMessage(reading::StoreReader& reader, const reading::Row& row);
    void addSession(const BookedSession& session);
    void addNames(std::string& bytes, const reading::SessionNames& names);
    void setNames(const reading::SessionNames& names, std::string_view json);
    void addIncident(const reading::Row& row);
    void addNamedEvent(std::string_view event, std::size_t table, const reading::Row& row);
    std::string_view eventOf(std::uint32_t category, std::uint16_t type);

    const Identity& identity_;
    const Omission& omission_;
    const ConsentHistory& consent_;
    SessionBook& sessions_;
    PayloadAttributes payload_;
    reading::JsonFields fields_;
    AttributeBytes attributes_;
    std::string_view event_;
    std::string record_;
    std::string uid_;
    // Fields of each record of the session that was met last.
    std::optional<std::int64_t> session_;
    std::string sessionBytes_;
    // When it was opened; none for a row without a session that is known.
    std::optional<double> opened_;
    std::unordered_map<std::uint64_t, std::string> events_; // names of messages
};

// "halyard.playback.issuedetector".
std::string eventName(std::uint32_t category, std::uint16_t type);

} // namespace halyard::exporting
