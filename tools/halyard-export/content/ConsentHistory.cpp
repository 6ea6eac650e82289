#include "content/ConsentHistory.h"

#include <algorithm>
#include <limits>

namespace halyard::exporting {

ConsentHistory ConsentHistory::always() {
    ConsentHistory history;
    history.always_ = true;
    return history;
}

// A refusal ends with the first consent after it that was given at a later time: what a
// clock that was set back leaves in doubt is refused.
double ConsentHistory::endOfRefusal(std::size_t refusal) const {
    const double begin = notes_[refusal].time;
    const auto end =
        std::find_if(notes_.begin() + static_cast<std::ptrdiff_t>(refusal), notes_.end(),
                     [begin](const Note& note) { return note.given && note.time > begin; });
    return end == notes_.end() ? std::numeric_limits<double>::infinity() : end->time;
}

bool ConsentHistory::isGivenThroughout(double from, double to) const {
    if (always_) {
        return true;
    }
    if (!(from <= to)) {
        return false;
    }
    bool isCovered = false;
    for (std::size_t i = 0; i < notes_.size(); ++i) {
        const Note& note = notes_[i];
        if (note.given) {
            isCovered = isCovered || note.time <= from;
        } else if (note.time <= to && from < endOfRefusal(i)) {
            return false;
        }
    }
    return isCovered;
}

bool ConsentHistory::isGivenAt(double time) const {
    return isGivenThroughout(time, time);
}

} // namespace halyard::exporting
