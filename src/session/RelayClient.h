// How this daemon names itself to the upload framework.
#pragma once

#include "common/Value.h"

namespace halyard {

inline constexpr int kRelayClientType = 19;
inline constexpr const char* kRelayClientName = "com.kestrel.halyard";
// "2.1", as the framework wants it.
inline Value relayClientVersion() {
    return Value(2.1F);
}

} // namespace halyard
