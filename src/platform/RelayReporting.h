// The telemetry upload framework: upload sessions and one-off messages.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "common/Error.h"
#include "common/Value.h"

namespace halyard::platform {

inline constexpr std::string_view kRelayReportingSessionInfoClientType =
    "kRelayReportingSessionInfoClientType";
inline constexpr std::string_view kRelayReportingSessionInfoClientVersion =
    "kRelayReportingSessionInfoClientVersion";
inline constexpr std::string_view kRelayReportingSessionInfoClientBundleID =
    "kRelayReportingSessionInfoClientBundleID";
inline constexpr std::string_view kRelayReportingSessionInfoSessionID =
    "kRelayReportingSessionInfoSessionID";
inline constexpr std::string_view kRelayReportingSessionInfoBatchEvent =
    "kRelayReportingSessionInfoBatchEvent";
inline constexpr std::string_view kRelayReportingSessionInfoHierarchyToken =
    "kRelayReportingSessionInfoHierarchyToken";
inline constexpr std::string_view kRelayReportingSessionInfoContainsRealtimeEvents =
    "kRelayReportingSessionInfoContainsRealtimeEvents";
inline constexpr std::string_view kRelayReportingUserInfoClientName =
    "kRelayReportingUserInfoClientName";
inline constexpr std::string_view kRelayReportingUserInfoServiceName =
    "kRelayReportingUserInfoServiceName";

// Messages of one kind that were dropped because they said again what the last one
// that was accepted had said. Times in seconds since 1970.
struct Repeats {
    std::uint32_t category = 0;
    std::uint32_t type = 0;
    std::uint64_t count = 0;
    double first = 0;
    double last = 0;
};

enum class UploadEnding : std::uint8_t {
    Stopped,      // By the client that owned it.
    Disconnected, // The client was lost, or the daemon was told to end.
};

// The code of an error for want of any back end. With another one a back end was given
// the message, and accounts for it.
inline constexpr std::int64_t kRelayReportingNoBackend = 2;

// One upload session. Dropping the last reference closes it.
class RelayReporting {
public:
    // A list of back-end names, or none when there is no back end.
    using BackendHandler = std::function<void(std::optional<List> backends)>;

    virtual ~RelayReporting() = default;
    // Looks for back ends. Calls `handler` once at most, on any thread, perhaps
    // late, perhaps before this returns, perhaps never.
    virtual void startConfigurationWithCompletionHandler(BackendHandler handler) = 0;
    // Must not block: what cannot be taken at once is an error.
    [[nodiscard]] virtual MaybeError
    sendMessageWithCategory(std::uint16_t category, std::uint32_t type, Dictionary payload) = 0;
    // Repeats that are over: before the message that ended them, or at the end.
    virtual void noteRepeats(const Repeats& repeats) = 0;
    // How it is about to end; Stopped where nobody says.
    virtual void noteEnding(UploadEnding ending) = 0;
    virtual void flushMessages() = 0;
    virtual std::string description() const = 0;
};

class RelayReportingFramework {
public:
    virtual ~RelayReportingFramework() = default;
    // `parentToken` may be empty. The token is a string.
    virtual Value newSecureHierarchyTokenFromParentToken(const Value& parentToken) = 0;
    // Never null. `frameworksToCheck` empty means all.
    virtual std::shared_ptr<RelayReporting> initWithSessionInfo(const Dictionary& sessionInfo,
                                                                const Dictionary& userInfo,
                                                                const List& frameworksToCheck) = 0;
    [[nodiscard]] virtual MaybeError sendOneMessageWithSessionInfo(const Dictionary& sessionInfo,
                                                                   const Dictionary& userInfo,
                                                                   std::uint16_t category,
                                                                   std::uint32_t type,
                                                                   const Dictionary& payload) = 0;
};

} // namespace halyard::platform
