#include "content/DriverFacts.h"

#include <fmt/format.h>
#include <tuple>

namespace halyard::exporting {
namespace {

void join(std::string& key, const std::string& part) {
    if (!part.empty()) {
        key += (key.empty() ? "" : "_") + part;
    }
}

// "group_subgroup", of which one may be missing.
std::string groupsIn(const DriverFacts& facts) {
    std::string key;
    join(key, facts.group);
    join(key, facts.subgroup);
    return key;
}

std::string cleaned(std::string driver) {
    return linux_::asInKeys(driver.substr(0, driver.find('<')));
}

} // namespace

DriverNames::DriverNames(const std::vector<linux_::DriverChannel>& channels) {
    for (const linux_::DriverChannel& channel : channels) {
        DriverFacts facts{cleaned(channel.driver), linux_::asInKeys(channel.group.value_or("")),
                          linux_::asInKeys(channel.subgroup.value_or("")),
                          linux_::asInKeys(channel.name), channel.unit};
        std::string key = facts.driver;
        join(key, groupsIn(facts));
        key += '/' + facts.channel;
        groups_.try_emplace(groupsIn(facts), facts.group, facts.subgroup);
        known_.try_emplace(std::move(key), std::move(facts));
    }
}

std::optional<DriverFacts> DriverNames::factsOf(std::string_view key, std::string_view kind) const {
    const std::string middle = fmt::format("_{}_", kind);
    const std::size_t at = key.find(middle);
    if (at == std::string_view::npos) {
        return std::nullopt;
    }
    DriverFacts facts;
    const std::string_view before = key.substr(0, at);
    facts.channel = key.substr(at + middle.size());
    const auto known = known_.find(fmt::format("{}/{}", before, facts.channel));
    if (known != known_.end()) {
        return known->second;
    }
    // The longest end that is a group of this device; else the last part is the group.
    for (std::size_t from = 0;;) {
        const auto found = groups_.find(before.substr(from));
        if (found != groups_.end()) {
            std::tie(facts.group, facts.subgroup) = found->second;
            facts.driver = before.substr(0, from == 0 ? 0 : from - 1);
            return facts;
        }
        const std::size_t next = before.find('_', from);
        if (next == std::string_view::npos) {
            break;
        }
        from = next + 1;
    }
    const std::size_t last = before.rfind('_');
    facts.group = last == std::string_view::npos ? before : before.substr(last + 1);
    facts.driver = last == std::string_view::npos ? std::string_view() : before.substr(0, last);
    return facts;
}

} // namespace halyard::exporting
