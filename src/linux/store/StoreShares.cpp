#include "linux/store/StoreShares.h"

#include <algorithm>
#include <fmt/format.h>
#include <utility>

namespace halyard::linux_ {
namespace {

constexpr std::size_t kLeastSweep = 64;
// Of a share: how long a stretch becomes, and so how exactly a share is kept to.
constexpr std::uint64_t kStretches = 16;
// In ids, since to delete a session's rows all of a stretch are looked at.
constexpr std::int64_t kLongestStretch = 8192;

// What belongs to a client and to none of its sessions.
bool isLoose(const StoreRow& row) {
    return !std::holds_alternative<StoreOpenRow>(row) &&
           !std::holds_alternative<StoreCloseRow>(row) &&
           !std::holds_alternative<StoreRepeatRow>(row);
}

StoreUploadPtr uploadOf(const StoreRow& row) {
    const auto* const message = std::get_if<StoreMessageRow>(&row);
    return message != nullptr ? message->upload : nullptr;
}

} // namespace

void StoreShares::note(const StoreItem& item, const StoreDatabase::Inserted& inserted) {
    if (auto upload = uploadOf(item.row)) {
        const std::int64_t row = upload->row;
        added_.push_back({std::move(upload), row, inserted});
    } else if (item.client != nullptr && inserted.bytes >= kLargeRow && isLoose(item.row)) {
        added_.push_back({item.client, 0, inserted});
    }
}

void StoreShares::add(const Added& added, std::uint64_t share) {
    Holding& holding = holdings_[added.holder.get()];
    if (holding.holder.expired() || holding.session != added.session) {
        holding = Holding{added.holder, added.session, {}, 0}; // Another at the same place.
    }
    auto& stretches = holding.stretches;
    const auto& [table, id, bytes] = added.row;
    // Rows of others between those of a client would go with them.
    const bool goesOn = !stretches.empty() && stretches.back().table == table &&
                        stretches.back().bytes < share / kStretches &&
                        id - stretches.back().first < kLongestStretch &&
                        (added.session != 0 || stretches.back().last + 1 == id);
    if (goesOn) {
        stretches.back().last = id;
        stretches.back().bytes += bytes;
    } else {
        stretches.push_back({table, id, id, bytes});
    }
    holding.bytes += bytes;
    if (holding.bytes > share &&
        std::ranges::find(over_, added.holder.get()) == over_.end()) { // Each once.
        over_.push_back(added.holder.get());
    }
}

bool StoreShares::committed(std::uint64_t maxBytes) {
    for (const Cut& cut : cut_) {
        Holding& holding = holdings_.at(cut.holder);
        const auto end = holding.stretches.begin() + static_cast<std::ptrdiff_t>(cut.stretches);
        std::for_each(holding.stretches.begin(), end,
                      [&](const Stretch& gone) { holding.bytes -= gone.bytes; });
        holding.stretches.erase(holding.stretches.begin(), end);
    }
    cut_.clear();
    over_.clear();
    for (const Added& added : added_) {
        add(added, maxBytes / kHolderShare);
    }
    added_.clear();
    forgetThoseWhoHaveGone();
    return !over_.empty();
}

void StoreShares::forgetThoseWhoHaveGone() {
    if (holdings_.size() >= sweepAt_) {
        std::erase_if(holdings_, [this](const auto& each) {
            return each.second.holder.expired() &&
                   std::ranges::find(over_, each.first) == over_.end();
        });
        sweepAt_ = std::max(kLeastSweep, holdings_.size() * 2);
    }
}

StoreResult StoreShares::trim(StoreDatabase& database, std::uint64_t maxBytes) {
    for (const void* const holder : over_) {
        StoreResult done = cut(database, holder, holdings_.at(holder), maxBytes / kHolderShare);
        if (!done.ok()) {
            return done;
        }
    }
    return {};
}

StoreResult StoreShares::cut(StoreDatabase& database, const void* holder, Holding& holding,
                             std::uint64_t share) {
    std::uint64_t left = holding.bytes;
    std::size_t stretches = 0;
    while (left > share && stretches + 1 < holding.stretches.size()) {
        const Stretch& oldest = holding.stretches[stretches];
        const std::string whose = holding.session == 0
                                      ? std::string()
                                      : fmt::format(" AND upload_session = {}", holding.session);
        const std::string sql =
            fmt::format("DELETE FROM {} WHERE id BETWEEN {} AND {}{}",
                        storeSchema(oldest.table).name, oldest.first, oldest.last, whose);
        const int code = sqlite3_exec(database.handle(), sql.c_str(), nullptr, nullptr, nullptr);
        if (code != SQLITE_OK) {
            return database.resultOf(code);
        }
        removed_[static_cast<std::size_t>(oldest.table)] +=
            static_cast<std::uint64_t>(sqlite3_changes64(database.handle()));
        left -= oldest.bytes;
        ++stretches;
    }
    cut_.push_back({holder, stretches});
    return {};
}

} // namespace halyard::linux_
