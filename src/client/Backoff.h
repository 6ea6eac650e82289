// How long to wait before each attempt to reconnect: doubled from first to last.
#pragma once

#include <algorithm>
#include <chrono>

namespace halyard::client {

class Backoff {
public:
    using Duration = std::chrono::milliseconds;

    static constexpr Duration kDefaultFirst{50};
    static constexpr Duration kDefaultLast{5000};

    // Zero means the default.
    Backoff(Duration first, Duration last)
        : first_(first.count() != 0 ? first : kDefaultFirst),
          last_(std::max(last.count() != 0 ? last : kDefaultLast, first_)), next_(first_) {}

    Duration next() {
        const Duration result = next_;
        next_ = std::min(2 * next_, last_);
        return result;
    }
    // A connection that held for `lived` proves the daemon well only if it was
    // longer than the longest wait: one that is refused again and again (accepted
    // and closed at once) is not to be tried in a tight loop.
    void connectionEnded(std::chrono::steady_clock::duration lived) {
        if (lived >= last_) {
            next_ = first_;
        }
    }

private:
    Duration first_;
    Duration last_;
    Duration next_;
};

} // namespace halyard::client
