// What one call puts into the queue: a Record, then its list of reporter IDs,
// then the MessagePack entries of its dictionary.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>

#include "halyard/halyard.h"
#include "protocol/Request.h"

namespace halyard::client {

// A C callback with its context. Called once, on the client's thread.
struct Callback {
    enum class Shape : std::uint8_t { None, Done, ServiceType, Reporter, Reporters };

    Shape shape = Shape::None;
    union {
        halyard_done_fn done = nullptr;
        halyard_service_type_fn serviceType;
        halyard_reporter_fn reporter;
        halyard_reporters_fn reporters;
    };
    void* context = nullptr;

    explicit operator bool() const { return shape != Shape::None; }
};

inline Callback doneCallback(halyard_done_fn done, void* context) {
    Callback callback;
    if (done != nullptr) {
        callback.shape = Callback::Shape::Done;
        callback.done = done;
        callback.context = context;
    }
    return callback;
}

struct Record {
    protocol::Method method;
    bool broadcast = false; // no list of IDs at all
    std::uint16_t type = 0; // of a message, or the service type
    std::uint32_t category = 0;
    std::int64_t reporterID = 0;
    std::uint32_t idCount = 0;
    std::uint32_t entryCount = 0; // of the dictionary
    std::uint32_t bodyBytes = 0;  // its MessagePack entries, without the map's header
    Callback callback = {};

    bool isMessage() const { return method == protocol::Method::SendMessage; }
    const char* afterHeader() const { return reinterpret_cast<const char*>(this) + sizeof(Record); }
    std::int64_t idAt(std::uint32_t index) const {
        std::int64_t id = 0;
        std::memcpy(&id, afterHeader() + index * sizeof(id), sizeof(id));
        return id;
    }
    std::string_view body() const {
        return {afterHeader() + idCount * sizeof(std::int64_t), bodyBytes};
    }
};
static_assert(std::is_trivially_copyable_v<Record> && alignof(Record) <= 8);

} // namespace halyard::client
