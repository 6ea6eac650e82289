// What a receiver's answer means for what was sent.
//
// Source: OpenTelemetry protocol specification 1.5, "OTLP/HTTP Response" and "Throttling".
// Values; any thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace halyard::exporting {

struct Answer {
    int status = 0;         // of HTTP; 0: there was none
    std::string error;      // why there was none
    bool isStopped = false; // by us
    std::chrono::seconds retryAfter{0};
    std::string body; // as much as is looked at
};

enum class Verdict : std::uint8_t {
    Accepted,
    Later,   // the same once more, after a while
    Refused, // nobody is let in with these credentials
    Dropped, // it will never be taken
};

Verdict verdictOn(const Answer& answer);

// What was rejected of what was accepted.
struct PartialSuccess {
    std::uint64_t rejected = 0;
    std::string message;
};
// Nonsense says that nothing was.
PartialSuccess partialSuccessIn(std::string_view body);

// When to try again, after so many failures in a row: doubled from one second up to five
// minutes, of which `share` (0 to 1, at random) decides over the second half; what the
// receiver asked for holds if it is longer, up to an hour.
std::chrono::milliseconds delayAfter(unsigned failures, double share,
                                     std::chrono::seconds retryAfter);

} // namespace halyard::exporting
