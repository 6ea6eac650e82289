// Cycles of a graph as a driver of a null sink tells them, for tests of what is made
// of them.
#pragma once

#include <initializer_list>
#include <vector>

#include "Cycle.h"

namespace halyard::pipewire {

constexpr Nanoseconds kMillisecond = 1'000'000;
constexpr Nanoseconds kLength = 20 * kMillisecond; // 960 frames at 48 kHz

// A graph with one driver. Every cycle takes kLength.
class TestGraph final {
public:
    static constexpr ObjectId kDriver = 29;

    explicit TestGraph(Nanoseconds start) : clock_(start) {}

    struct Follower {
        ObjectId id = 0;
        Progress progress = Progress::Finished;
        Nanoseconds wake = 50'000;  // after its signal
        Nanoseconds work = 100'000; // after that
    };

    // The next cycle, due at now(), which begins `late` after that.
    Cycle cycle(std::initializer_list<Follower> followers, Nanoseconds late = 80'000) {
        bool incomplete = false;
        const Nanoseconds signal = clock_ + late;
        Cycle result;
        for (const Follower& follower : followers) {
            const bool done = follower.progress == Progress::Finished;
            const bool awake = done || follower.progress == Progress::Awake;
            incomplete = incomplete || follower.progress == Progress::Triggered ||
                         follower.progress == Progress::Awake;
            result.followers.push_back(
                {.id = follower.id,
                 .previousSignal = previous_,
                 .signal = signal,
                 .awake = awake ? signal + follower.wake : signal,
                 .finish = done ? signal + follower.wake + follower.work : previous_,
                 .progress = follower.progress});
        }
        result.driver = {.id = kDriver,
                         .previousSignal = previous_,
                         .signal = signal,
                         .awake = signal + kMillisecond,
                         .finish = signal + kMillisecond};
        // The clock has gone on when a cycle that somebody missed is told.
        result.clock = clock_ + (incomplete ? kLength : 0);
        result.nextClock = result.clock + kLength;
        result.frames = 960;
        result.rateNumerator = 1;
        result.rateDenominator = 48000;
        previous_ = signal;
        clock_ += kLength;
        return result;
    }

    Nanoseconds now() const { return clock_; }
    void skip(Nanoseconds time) { clock_ += time; }

private:
    Nanoseconds clock_;
    Nanoseconds previous_ = 1;
};

} // namespace halyard::pipewire
