#include "platform/MessageAccounts.h"

#include <algorithm>
#include <limits>
#include <string_view>
#include <utility>

namespace halyard::platform {
namespace {

constexpr std::array<std::pair<MessageCount, std::string_view>, 5> kRules = {
    {{MessageCount::Test, "test"},
     {MessageCount::NoBackend, "no_backend"},
     {MessageCount::Limit, "limit"},
     {MessageCount::Transactions, "transactions"},
     {MessageCount::Sampled, "sampled"}}};

constexpr std::string_view kOtherLoss = "other";

// 0 for what is no count.
std::uint64_t countOf(const Value& value) {
    const bool counts =
        value.isInteger() && (value.kind() == Value::Kind::UInt || value.integerValue() >= 0);
    return counts ? value.unsignedValue() : 0;
}

// Stays at the largest number rather than begin anew.
void addUpTo(std::atomic<std::uint64_t>& sum, std::uint64_t count) {
    constexpr std::uint64_t kMost = std::numeric_limits<std::int64_t>::max();
    std::uint64_t before = sum.load();
    while (!sum.compare_exchange_weak(before, before + std::min(count, kMost - before))) {
    }
}

} // namespace

void MessageAccounts::addLostInClient(const Dictionary& counts) const {
    for (const auto& [reason, count] : counts) {
        const auto& names = protocol::kClientLossNames;
        const auto known = std::find(names.begin(), names.end(), reason.text());
        addUpTo(lostInClients_[static_cast<std::size_t>(known - names.begin())], countOf(count));
    }
}

Dictionary MessageAccounts::describe(std::uint64_t delivered) const {
    // What a message comes to is read before what it came from, so that one which moves
    // on meanwhile is waiting, and none is there twice.
    Dictionary notUploaded;
    std::uint64_t done = delivered;
    for (const auto& [rule, name] : kRules) {
        const std::uint64_t count = of(rule);
        notUploaded.set(name, count);
        done += count;
    }
    Dictionary lost;
    for (std::size_t i = 0; i < kClientLosses; ++i) {
        lost.set(i < protocol::kClientLossNames.size() ? protocol::kClientLossNames[i] : kOtherLoss,
                 lostInClients_[i].load());
    }
    const std::uint64_t repeats = of(MessageCount::Repeats);
    const std::uint64_t own = of(MessageCount::Own);
    const std::uint64_t offered = of(MessageCount::Offered);
    done += repeats;
    return Dictionary{{"requests", of(MessageCount::Requests)},
                      {"refused", of(MessageCount::Refused)},
                      {"bounded", of(MessageCount::Bounded)},
                      {"unaddressed", of(MessageCount::Unaddressed)},
                      {"offered", offered},
                      {"own", own},
                      {"repeats", repeats},
                      {"not_uploaded", notUploaded},
                      {"delivered", delivered},
                      {"waiting", static_cast<std::int64_t>(offered + own - done)},
                      {"lost_in_clients", lost}};
}

} // namespace halyard::platform
