// Names of what leaves, the same whenever it is sent: who receives a thing twice can
// tell.
//
// They are derived from the device's identity and what stands in the store, those of traces
// and spans as UUIDs of version 5 (RFC 9562): nothing has to be remembered for them. Values;
// any thread.
#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

namespace halyard::exporting {

using TraceID = std::array<char, 16>;
using SpanID = std::array<char, 8>;

class Identity {
public:
    Identity() = default;
    // `device`: the identity that the daemon gave its store.
    explicit Identity(std::string device) : device_(std::move(device)) {}

    const std::string& device() const { return device_; }

    // Of an upload session: its row, and when it was opened.
    TraceID traceOf(std::int64_t row, double opened) const;
    SpanID spanOf(std::int64_t row, double opened) const;
    // Of a glitch of that session.
    SpanID spanOfGlitch(std::int64_t row, double opened, double start, std::string_view node) const;
    // Of a row of a table: the device, the table, 16 bits of a time, and the row. The time tells
    // apart the rows of a store that was put back to an earlier state; it is when the row's
    // session was opened, or when a row without one was made. A text that mostly repeats the one
    // before it, for a UUID's digits are most of what a record weighs.
    void appendRecord(std::string& text, std::string_view table, std::int64_t row,
                      double time) const;

private:
    std::string device_;
};

inline std::string_view viewOf(const TraceID& id) {
    return {id.data(), id.size()};
}
inline std::string_view viewOf(const SpanID& id) {
    return {id.data(), id.size()};
}

} // namespace halyard::exporting
