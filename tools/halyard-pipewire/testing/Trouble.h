// What a player does instead of delivering sound in time, on command: in the
// process callback of its stream, on PipeWire's data thread.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "LatePages.h"

namespace halyard::glitching {

// Both clocks at one moment, in nanoseconds.
struct Moment {
    static Moment now();

    std::int64_t monotonic = 0;
    std::int64_t realtime = 0;
};

struct Span {
    Moment before;
    Moment after;
};

enum class Kind { Burn, Sleep, Fault };
std::optional<Kind> kindOf(std::string_view command);

// Hands one order at a time to the data thread and its result back. Without locks:
// the data thread must wait for nothing but what it is ordered to wait for.
class Trouble final {
public:
    // `done` is called on the data thread; collect() then has the result.
    explicit Trouble(std::function<void()> done) : done_(std::move(done)) {}

    // ---- The main thread
    bool busy() const { return state_ != State::Idle; }
    // In each of the next `cycles` cycles. Requires !busy(). Throws when Fault is
    // not possible here.
    void order(Kind kind, std::chrono::milliseconds time, std::int64_t cycles);
    std::optional<Span> collect();

    // ---- The data thread, once a cycle
    void cycle();

private:
    enum class State { Idle, Ordered, Done };

    void make();

    const std::function<void()> done_;
    std::atomic<State> state_ = State::Idle;
    Kind kind_ = Kind::Burn;
    std::chrono::milliseconds time_{0};
    std::int64_t cyclesLeft_ = 0;
    bool begun_ = false;
    Span span_;
    std::unique_ptr<LatePages> pages_;
};

} // namespace halyard::glitching
