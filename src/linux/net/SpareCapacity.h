// What a connection keeps of its buffers, and what its client is charged for them.
#pragma once

#include <cstddef>
#include <string>

namespace halyard::linux_ {

// Bytes. So many are a connection's own, and stay for what comes next.
inline constexpr std::size_t kKeptCapacity = 4096;

inline void dropSpareCapacity(std::string& text) {
    if (text.capacity() > kKeptCapacity) {
        text = std::string();
    }
}

inline std::size_t chargedFor(const std::string& text) {
    return text.capacity() > kKeptCapacity ? text.capacity() : 0;
}

} // namespace halyard::linux_
