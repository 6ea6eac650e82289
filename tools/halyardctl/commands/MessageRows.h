// Messages as rows of the store have them, for the commands that list and that follow.
//
// Not thread-safe.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "output/JsonStream.h"
#include "output/Table.h"
#include "reading/Sessions.h"

namespace halyard::ctl {

// Borrows the payload from its row.
struct Message {
    std::int64_t id = 0;
    std::optional<std::int64_t> session; // none for a single message
    reading::SessionNames names;
    std::string category;
    std::string_view type;
    std::optional<double> time;
    std::string_view payload;
};

// What messageIn() takes, as SQL has it.
inline constexpr const char* kMessageColumns =
    "upload_session, session_info, user_info, category, type, payload, time";

Message messageIn(const reading::Row& row, reading::SessionDirectory& directory,
                  reading::JsonFields& fields);

// An object.
void writeMessage(JsonStream& json, const Message& message);
std::vector<Table::Column> messageColumns();
std::vector<Cell> messageCells(const Message& message);

} // namespace halyard::ctl
