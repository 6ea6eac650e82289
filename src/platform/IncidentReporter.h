#pragma once

#include <functional>
#include <string_view>

#include "common/Value.h"

namespace halyard::platform {

// The keys of an incident's signature. What is not known is left out.
inline constexpr std::string_view kIncidentSignatureDomain = "domain";
inline constexpr std::string_view kIncidentSignatureType = "type";
inline constexpr std::string_view kIncidentSignatureSubType = "subType";
inline constexpr std::string_view kIncidentSignatureSubtypeContext = "subtypeContext";
inline constexpr std::string_view kIncidentSignatureDetectedProcess = "detectedProcess";

// Captures what may explain an incident, for somebody to look at later.
class IncidentReporter {
public:
    using Reply = std::function<void(const Dictionary& response)>;

    virtual ~IncidentReporter() = default;
    // Any thread. Returns at once, whatever the snapshot costs; one that cannot
    // be taken is told in the response. `duration` is in seconds; `event` and
    // `payload` may be none. Calls `reply` once at most, on any thread, perhaps
    // late.
    virtual void snapshotWithSignature(const Dictionary& signature, double duration,
                                       const Value& event, const Value& payload, Reply reply) = 0;
};

} // namespace halyard::platform
