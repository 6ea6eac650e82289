#include "linux/store/StoreEventServices.h"

#include <algorithm>
#include <fnmatch.h>
#include <utility>

namespace halyard::linux_ {

StoreAnalyticsService::StoreAnalyticsService(Store& store, std::vector<std::string> wanted)
    : store_(store), wanted_(std::move(wanted)) {}

void StoreAnalyticsService::setWanted(std::vector<std::string> wanted) {
    const MutexLock lock(mutex_);
    wanted_ = std::move(wanted);
    known_.clear();
}

const StoreAnalyticsService::Known&
StoreAnalyticsService::knownLocked(std::string_view name) const {
    if (const auto found = known_.find(name); found != known_.end()) {
        return found->second;
    }
    if (known_.size() >= kMaxKnownNames) {
        known_.clear();
    }
    const std::string text(name);
    const bool wanted = std::any_of(wanted_.begin(), wanted_.end(), [&](const std::string& glob) {
        return ::fnmatch(glob.c_str(), text.c_str(), 0) == 0;
    });
    return known_.emplace(text, Known{Value(name), wanted}).first->second;
}

bool StoreAnalyticsService::isEventUsed(std::string_view name) const {
    if (!store_.isOpen()) {
        return false;
    }
    const MutexLock lock(mutex_);
    return knownLocked(name).wanted;
}

void StoreAnalyticsService::sendEventLazily(std::string_view name, PayloadBuilder builder) {
    Value shared;
    {
        const MutexLock lock(mutex_);
        shared = knownLocked(name).name;
    }
    store_.addAnalyticsEvent(shared, std::move(builder));
}

} // namespace halyard::linux_
