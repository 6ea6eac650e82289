#include "Trouble.h"

#include <ctime>

namespace halyard::glitching {

namespace {

std::int64_t read(clockid_t clock) {
    timespec time{};
    clock_gettime(clock, &time);
    return time.tv_sec * 1'000'000'000 + time.tv_nsec;
}

void burn(std::chrono::nanoseconds time) {
    const auto end = read(CLOCK_MONOTONIC) + time.count();
    while (read(CLOCK_MONOTONIC) < end) {
    }
}

void sleep(std::chrono::nanoseconds time) {
    const auto end = read(CLOCK_MONOTONIC) + time.count();
    const timespec until{.tv_sec = end / 1'000'000'000, .tv_nsec = end % 1'000'000'000};
    while (clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &until, nullptr) != 0) {
    }
}

} // namespace

Moment Moment::now() {
    return {.monotonic = read(CLOCK_MONOTONIC), .realtime = read(CLOCK_REALTIME)};
}

std::optional<Kind> kindOf(std::string_view command) {
    if (command == "burn") {
        return Kind::Burn;
    }
    if (command == "sleep") {
        return Kind::Sleep;
    }
    return command == "fault" ? std::optional(Kind::Fault) : std::nullopt;
}

void Trouble::order(Kind kind, std::chrono::milliseconds time, std::int64_t cycles) {
    if (kind == Kind::Fault) {
        pages_ = std::make_unique<LatePages>(static_cast<std::size_t>(cycles), time);
    }
    kind_ = kind;
    time_ = time;
    cyclesLeft_ = cycles;
    begun_ = false;
    state_ = State::Ordered;
}

std::optional<Span> Trouble::collect() {
    if (state_ != State::Done) {
        return std::nullopt;
    }
    pages_.reset();
    const Span span = span_;
    state_ = State::Idle;
    return span;
}

void Trouble::cycle() {
    if (state_ != State::Ordered) {
        return;
    }
    if (!begun_) {
        begun_ = true;
        span_.before = Moment::now();
    }
    make();
    if (--cyclesLeft_ <= 0) {
        span_.after = Moment::now();
        state_ = State::Done;
        done_();
    }
}

void Trouble::make() {
    switch (kind_) {
    case Kind::Burn:
        return burn(time_);
    case Kind::Sleep:
        return sleep(time_);
    case Kind::Fault:
        return pages_->touchNext();
    }
}

} // namespace halyard::glitching
