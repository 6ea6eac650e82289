// Rows of the store as log records.
//
// Not thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

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

    // The row of kLogTables[table] as an encoded LogRecord. Valid until the next call.
    // `reader` is for what belongs to it.
    const std::string& recordOf(reading::StoreReader& reader, std::size_t table,
                                const reading::Row& row);

private:
    void begin(std::string_view event, int severity, std::size_t table, const reading::Row& row);
    void addMessage(reading::StoreReader& reader, const reading::Row& row);
    void addNames(const reading::SessionNames& names, std::string_view userInfo, bool leave);
    void addIncident(const reading::Row& row);
    void addNamedEvent(std::string_view event, std::size_t table, const reading::Row& row);

    const Identity& identity_;
    const Omission& omission_;
    const ConsentHistory& consent_;
    SessionBook& sessions_;
    PayloadAttributes payload_;
    reading::JsonFields fields_;
    std::string record_;
};

// "halyard.playback.issuedetector".
std::string eventName(std::uint32_t category, std::uint16_t type);

} // namespace halyard::exporting
