#include "linux/net/ClientBudgets.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <string>
#include <string_view>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

constexpr std::size_t kMostOfStat = 4096;
// Fields between the closing parenthesis of the name and the start.
constexpr int kFieldsBefore = 19;
constexpr std::size_t kLeastSweep = 64;

} // namespace

std::uint64_t startOfProcess(std::int32_t pid) {
    const auto text = readSmallFile(fmt::format("/proc/{}/stat", pid), kMostOfStat);
    if (!text.ok()) {
        return 0;
    }
    std::string_view rest = text.value();
    rest.remove_prefix(std::min(rest.rfind(')'), rest.size() - 1) + 1); // A name may hold any.
    for (int i = 0; i <= kFieldsBefore; ++i) {
        const std::size_t blank = rest.find(' ');
        if (blank == std::string_view::npos) {
            return 0;
        }
        rest.remove_prefix(blank + 1);
    }
    std::uint64_t start = 0;
    (void)std::from_chars(rest.data(), rest.data() + rest.size(), start);
    return start;
}

platform::ClientBudgetPtr ClientBudgets::of(const Peer& peer) {
    if (budgets_.size() >= sweepAt_) {
        std::erase_if(budgets_, [](const auto& each) { return each.second.expired(); });
        sweepAt_ = std::max(kLeastSweep, budgets_.size() * 2);
    }
    auto& known = budgets_[{peer.pid, startOfProcess(peer.pid), peer.uid}];
    auto budget = known.lock();
    if (budget == nullptr) {
        budget = std::make_shared<platform::ClientBudget>(limits_);
        budget->setReliefHandler([relief = relief_] {
            const MutexLock lock(relief->mutex);
            if (relief->tell) {
                relief->tell();
            }
        });
        known = budget;
    }
    return budget;
}

} // namespace halyard::linux_
