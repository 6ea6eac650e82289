// The upload framework over the store, its one back end.
//
// Any thread.
#pragma once

#include "linux/store/Store.h"
#include "platform/Random.h"
#include "platform/RelayReporting.h"

namespace halyard::linux_ {

inline constexpr std::string_view kStoreErrorDomain = "com.kestrel.halyard.store";

enum class StoreErrorCode : std::int64_t {
    NotTaken = 1, // What waits for the store fills the bounds.
    NoStore = platform::kRelayReportingNoBackend,
};

class StoreRelayReporting final : public platform::RelayReportingFramework {
public:
    static constexpr std::string_view kBackend = "store";

    // Borrows both, which must outlive this and every session it made.
    StoreRelayReporting(Store& store, platform::Random& random) : store_(store), random_(random) {}

    // 128 random bits in hexadecimal; the parent does not show in them.
    Value newSecureHierarchyTokenFromParentToken(const Value& parentToken) override;
    std::shared_ptr<platform::RelayReporting>
    initWithSessionInfo(const Dictionary& sessionInfo, const Dictionary& userInfo,
                        const List& frameworksToCheck) override;
    MaybeError sendOneMessageWithSessionInfo(const Dictionary& sessionInfo,
                                             const Dictionary& userInfo, std::uint16_t category,
                                             std::uint32_t type,
                                             const Dictionary& payload) override;

private:
    Store& store_;
    platform::Random& random_;
};

} // namespace halyard::linux_
