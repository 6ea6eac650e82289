#include "platform/MessageAccounts.h"

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

} // namespace

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
                      {"waiting", static_cast<std::int64_t>(offered + own - done)}};
}

} // namespace halyard::platform
