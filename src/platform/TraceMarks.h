#pragma once

#include <cstdint>

namespace halyard::platform {

// Kernel trace marks. Any thread; costs a few ns while nobody traces.
class TraceMarks {
public:
    virtual ~TraceMarks() = default;
    virtual void mark(std::uint32_t code, std::uint64_t arg1, std::uint64_t arg2,
                      std::uint64_t arg3, std::uint64_t arg4) = 0;
};

} // namespace halyard::platform
