// The requests a peer may send, as typed values.
//
// The wire that carries them is described in docs/wire.md; Wire.h turns its
// bytes into these and back.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "common/Error.h"
#include "common/Value.h"

namespace halyard::protocol {

enum class Method : std::uint8_t {
    CreateReportingSession,
    SetServiceType,
    GetServiceNameForReporterID,
    SetConfiguration,
    StartReportingSessionForID,
    SendMessage,
    StopReportingSessionForID,
    DestroyReportingSession,
    ReporterIDValid,
    GetAllReporters,
    KillService,
    // What a client has to tell of itself.
    ClientDropped,
    // For operators, beside the request interface.
    AdminPostNotification,
    AdminFlush,
    AdminStatus,
    AdminPurge,
};

using ReporterIDs = std::vector<std::int64_t>;

// The arguments of every method; each method's table says which it takes.
struct Arguments {
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
    Dictionary dictionary{}; // a message, a configuration, counts
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    std::optional<ReporterIDs> reporterIDs{}; // nullopt: no list at all (broadcast)
    std::string name{};
};

// Takes the answer to one request.
class Responder {
public:
    virtual ~Responder() = default;
    // Called once at most, on any thread.
    virtual void answer(const MaybeError& error, const Value& result) = 0;
};

// The reply callback of a request: callable any number of times, of which only
// the first counts. Copies share that one answer. If the last copy goes without
// an answer, the peer is told so (IpcErrorCode::Unanswered).
//
// An empty Reply (of a notification) may be called and does nothing.
class Reply {
public:
    Reply() = default;
    explicit Reply(std::unique_ptr<Responder> responder);

    void operator()(const MaybeError& error, const Value& result) const;
    explicit operator bool() const { return state_ != nullptr; }

private:
    struct State;
    std::shared_ptr<State> state_;
};

struct Request {
    Method method;
    Arguments arguments;
    Reply reply; // empty for a notification
};

} // namespace halyard::protocol
