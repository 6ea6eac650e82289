#include "WatchedProgram.h"

#include <algorithm>

namespace halyard::pipewire {

namespace {

// Long enough for a dozen cycles of the longest usual length, and for the others to
// be told apart.
constexpr Nanoseconds kSearch = 400'000'000;
constexpr int kMaxTries = 8;
// Many streams may begin at once, and the history is short.
constexpr Nanoseconds kSoon = 5'000'000;

} // namespace

void WatchedProgram::streamRuns(Nanoseconds now) {
    if (streams_++ == 0 && !reader_.threadKnown()) {
        reader_.beginSearch();
        searchedSince_ = now;
        tries_ = 0;
    }
    sample(now);
}

void WatchedProgram::streamStopped(Nanoseconds now) {
    sample(now);
    --streams_;
}

void WatchedProgram::sample(Nanoseconds now) {
    if (history_.latest() == nullptr || now - history_.latest()->at >= kSoon) {
        ThreadSample sample = reader_.sample(now);
        countWaiting(sample, last_);
        history_.add(sample);
    }
}

void WatchedProgram::seek(Nanoseconds now, Nanoseconds cycleLength) {
    if (reader_.threadKnown() || tries_ >= kMaxTries || cycleLength == 0 ||
        now - searchedSince_ < std::max(kSearch, 4 * cycleLength)) {
        return;
    }
    const std::string taken = reader_.thread();
    ++tries_;
    reader_.findThread(static_cast<std::uint64_t>((now - searchedSince_) / cycleLength), streams_);
    if (!taken.empty() && reader_.thread() != taken) {
        history_ = {}; // it was another's
        last_ = {};
    }
}

} // namespace halyard::pipewire
