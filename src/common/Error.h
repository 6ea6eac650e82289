// A failure as a value: what replies carry and platform operations return.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halyard {

struct Error {
    std::string domain;
    std::int64_t code = 0;
    std::string message;

    bool operator==(const Error&) const = default;
};

// None is success.
using MaybeError = std::optional<Error>;

// The service's own refusals.
inline constexpr std::string_view kReportingErrorDomain = "com.kestrel.audio.reporting";
// What the connection itself answers.
inline constexpr std::string_view kIpcErrorDomain = "com.kestrel.halyard.ipc";

enum class IpcErrorCode : std::int64_t {
    UnknownMethod = 1,
    BadArgument = 2,
    NotAllowed = 3,
    Unanswered = 4, // The reply was dropped without an answer.
    Bounded = 5,    // A bound of the client's budget; the message names it.
};

} // namespace halyard
