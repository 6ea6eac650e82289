// What stands behind the C ABI's handles of clients and sessions, and what the
// calls that take them share.
#pragma once

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <cstring>
#include <memory>

#include "client/Client.h"
#include "client/DictionaryHandle.h"
#include "halyard/halyard.h"

// A client lives as long as its handle or a session's.
struct halyard_client {
    std::shared_ptr<halyard::client::Client> client;
};

struct halyard_session {
    std::shared_ptr<halyard::client::Client> client;
    std::int64_t reporterID;
    std::atomic<bool> started{false};
    // Made beforehand, so that destruction needs no memory.
    std::unique_ptr<halyard::client::Abandoned> abandoned =
        std::make_unique<halyard::client::Abandoned>();
};

namespace halyard::client {

// `size` bytes of what the caller's version of the struct has, the rest zero.
template <class Struct> void copySized(Struct& to, const Struct& from, std::size_t size) {
    std::memcpy(&to, &from, std::min(size, sizeof(Struct)));
}

Record recordOf(protocol::Method method, std::int64_t reporterID, Callback callback = {});

// Counts a message that cannot be handed over; answers why.
halyard_result refuse(Client& client, const Record& record, halyard_result reason);

// Completes `submission`, which may have a tail of plain entries, with the
// dictionary and hands it over.
halyard_result submitDictionary(Client& client, Submission submission,
                                const DictionaryWriter& writer);

// Completes the record of a message, with its record.idCount IDs, and hands it over.
halyard_result submitMessage(Client& client, const halyard_dictionary* message, Record record,
                             std::uint32_t category, std::uint16_t type, const std::int64_t* ids);

} // namespace halyard::client
