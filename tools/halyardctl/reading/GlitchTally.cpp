#include "reading/GlitchTally.h"

#include <algorithm>
#include <cmath>
#include <ctime>
#include <tuple>

namespace halyard::reading {
namespace {

// Known names begin with a letter of ours, so that no name can be one of these.
constexpr const char* kUnknown = "?";
constexpr const char* kOthers = "*";

const std::optional<std::string>& nameIn(const Glitch& glitch, GlitchKey by) {
    switch (by) {
    case GlitchKey::Device:
        return glitch.device;
    case GlitchKey::Cause:
        return glitch.cause;
    default:
        return glitch.application;
    }
}

} // namespace

void GlitchSum::add(const Glitch& glitch) {
    const double silent = glitch.seconds.value_or(0);
    ++glitches;
    if (std::isfinite(silent) && silent > 0) {
        seconds += silent;
        longest = std::max(longest, silent);
    }
}

double hourOf(double seconds) {
    const auto whole = static_cast<std::time_t>(std::floor(seconds));
    std::tm local{};
    if (::localtime_r(&whole, &local) == nullptr) {
        return 0;
    }
    return static_cast<double>(whole - local.tm_min * 60 - local.tm_sec);
}

std::string GlitchTally::keyOf(const Glitch& glitch) const {
    if (by_ == GlitchKey::Hour) {
        return std::to_string(hourOf(glitch.time()));
    }
    const auto& name = nameIn(glitch, by_);
    return name ? "=" + *name : kUnknown;
}

void GlitchTally::add(const Glitch& glitch) {
    auto found = sums_.find(keyOf(glitch));
    if (found == sums_.end()) {
        const bool fits = sums_.size() < kMostNames;
        Entry entry;
        entry.isOthers = !fits;
        if (by_ == GlitchKey::Hour) {
            entry.hour = hourOf(glitch.time());
        } else if (fits) {
            entry.name = nameIn(glitch, by_);
        }
        found = sums_.emplace(fits ? keyOf(glitch) : kOthers, std::move(entry)).first;
    }
    found->second.sum.add(glitch);
}

std::vector<GlitchTally::Entry> GlitchTally::entries() const {
    std::vector<Entry> all;
    for (const auto& [key, entry] : sums_) {
        all.push_back(entry);
    }
    std::sort(all.begin(), all.end(), [this](const Entry& left, const Entry& right) {
        if (by_ == GlitchKey::Hour) {
            return left.hour < right.hour;
        }
        return std::tie(right.sum.glitches, right.sum.seconds, left.name) <
               std::tie(left.sum.glitches, left.sum.seconds, right.name);
    });
    return all;
}

} // namespace halyard::reading
