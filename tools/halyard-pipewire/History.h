// The latest samples of something, so that it can be looked up what it was when the
// server tells, up to a second later, that a cycle was missed.
//
// Pure; not thread-safe.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>

#include "Cycle.h"

namespace halyard::pipewire {

// `Sample` has its time in `at`.
template <class Sample> class History final {
public:
    // At 50 ms: longer than the records are late, and a second of before.
    static constexpr std::size_t kSamples = 96;

    // Requires that time does not go back.
    void add(const Sample& sample) {
        samples_[next_] = sample;
        next_ = (next_ + 1) % kSamples;
        count_ = std::min(count_ + 1, kSamples);
    }

    // The last sample not after `moment`; the oldest if all are. Null when empty.
    const Sample* before(Nanoseconds moment) const {
        const Sample* found = count_ != 0 ? &at(0) : nullptr;
        for (std::size_t i = 1; i < count_ && at(i).at <= moment; ++i) {
            found = &at(i);
        }
        return found;
    }
    // The first sample not before `moment`; the latest if none is. Null when empty.
    const Sample* after(Nanoseconds moment) const {
        for (std::size_t i = 0; i < count_; ++i) {
            if (at(i).at >= moment) {
                return &at(i);
            }
        }
        return latest();
    }
    const Sample* latest() const { return count_ != 0 ? &at(count_ - 1) : nullptr; }

    // Calls `visit` for the samples from `from` to `to`, oldest first.
    template <class Visit> void each(Nanoseconds from, Nanoseconds to, Visit visit) const {
        for (std::size_t i = 0; i < count_; ++i) {
            if (at(i).at >= from && at(i).at <= to) {
                visit(at(i));
            }
        }
    }

private:
    const Sample& at(std::size_t index) const {
        return samples_[(next_ + kSamples - count_ + index) % kSamples];
    }

    std::array<Sample, kSamples> samples_{};
    std::size_t next_ = 0;
    std::size_t count_ = 0;
};

} // namespace halyard::pipewire
