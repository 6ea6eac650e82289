// Records of the queue as frames of the wire.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "client/Record.h"
#include "common/Value.h"

namespace halyard::client {

// Appends the record's call: a request when there is a message ID, else a
// notification. The dictionary's bytes go through as they are.
void appendFrame(std::string& out, std::optional<std::uint32_t> messageID, const Record& record);

// Appends a call whose only argument is the ID.
void appendSessionCall(std::string& out, std::optional<std::uint32_t> messageID,
                       protocol::Method method, std::int64_t reporterID);

// The dictionary of a record, as a value. Empty when it cannot be read.
Dictionary dictionaryOf(const Record& record);

// What a frame may take beside the dictionary and the list of IDs.
inline constexpr std::size_t kFrameOverhead = 128;
inline constexpr std::uint32_t kFrameElements = 16;

} // namespace halyard::client
