#include "WatchedProgram.h"

#include <algorithm>

namespace halyard::pipewire {

namespace {

// Long enough for a dozen cycles of the longest usual length, and for the others to
// be told apart.
constexpr Nanoseconds kSearch = 400'000'000;
constexpr int kMaxTries = 8;

} // namespace

void WatchedProgram::seek(Nanoseconds now, Nanoseconds cycleLength) {
    if (reader_.threadKnown() || tries_ >= kMaxTries || cycleLength == 0) {
        return;
    }
    if (searchedSince_ == 0) {
        reader_.findThread(0);
        searchedSince_ = now;
    } else if (now - searchedSince_ >= std::max(kSearch, 4 * cycleLength)) {
        const auto wakeUps = static_cast<std::uint64_t>((now - searchedSince_) / cycleLength);
        ++tries_;
        reader_.findThread(wakeUps);
    }
}

} // namespace halyard::pipewire
