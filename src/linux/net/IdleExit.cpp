#include "linux/net/IdleExit.h"

#include <algorithm>
#include <utility>

#include "platform/Log.h"

namespace halyard::linux_ {

IdleExit::IdleExit(const platform::Clock& clock, platform::WorkQueue& queue, Actions actions)
    : clock_(clock), queue_(queue), actions_(std::move(actions)), idleSince_(clock.steadyTime()) {}

void IdleExit::setLimit(std::optional<std::chrono::seconds> limit) {
    limit_ = limit;
    arm();
}

void IdleExit::connectionsChanged(std::size_t connections) {
    ++changes_;
    connections_ = connections;
    if (connections == 0) {
        idleSince_ = clock_.steadyTime();
        arm();
    }
}

bool IdleExit::isIdle() const {
    return limit_ && connections_ == 0 && clock_.steadyTime() - idleSince_ >= *limit_;
}

void IdleExit::arm() {
    if (!limit_ || connections_ != 0 || leaving_) {
        return;
    }
    const platform::SteadyTime wanted = idleSince_ + *limit_;
    if (due_ && *due_ <= wanted) {
        return; // Looks again when it goes off.
    }
    due_ = wanted;
    const auto delay = std::max(wanted - clock_.steadyTime(), std::chrono::nanoseconds(0));
    queue_.asyncAfter(delay, [this, wanted] {
        if (due_ == wanted) {
            due_.reset();
            look();
        }
    });
}

void IdleExit::look() {
    if (leaving_ || !isIdle()) {
        arm();
        return;
    }
    leaving_ = true;
    actions_.drain(
        [this, changes = changes_] { queue_.async([this, changes] { drained(changes); }); });
}

void IdleExit::drained(std::uint64_t changes) {
    if (changes != changes_ || !isIdle()) {
        leaving_ = false;
        arm();
        return;
    }
    actions_.stopAccepting([this](bool stopped) {
        if (stopped) {
            HY_LOG_INFO(
                HYReportingPlatformCategory, "ending: nobody connected for {} s",
                std::chrono::ceil<std::chrono::seconds>(clock_.steadyTime() - idleSince_).count());
            actions_.end();
        } else {
            leaving_ = false;
            arm();
        }
    });
}

} // namespace halyard::linux_
