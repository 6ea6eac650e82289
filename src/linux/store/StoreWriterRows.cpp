// What of StoreWriter inserts the rows of a group.
#include <algorithm>
#include <utility>

#include "linux/store/StoreWriter.h"

namespace halyard::linux_ {
namespace {

// Rows of a group that are inserted by a statement for each table: so many at a time, in
// which what two tables have in common is still in the cache, and if there are as many.
constexpr std::size_t kRowsTogether = 512;
constexpr std::size_t kLeastTogether = 16;

} // namespace

StoreResult StoreWriter::insertAll(std::span<StoreItem> group) {
    rejected_.clear();
    while (!group.empty()) {
        const auto some = group.first(std::min(group.size(), kRowsTogether));
        if (StoreResult done = insertSome(some); !done.ok()) {
            return done;
        }
        group = group.subspan(some.size());
    }
    return {};
}

// Of each table in their order. Few rows are not worth the preparation.
StoreResult StoreWriter::insertSome(std::span<StoreItem> items) {
    messages_.clear();
    events_.clear();
    StoreResult done;
    for (StoreItem& item : items) {
        buildPayload(item);
        if (items.size() < kLeastTogether || !StoreDatabase::comesInNumbers(item.row)) {
            done = insertOne(item);
        } else if (done = database_.makeReady(item.row); !done.ok()) {
            done = refuse(item, done);
        } else {
            auto& table = tableOf(item.row) == StoreTable::UploadMessage ? messages_ : events_;
            table.push_back(&item);
        }
        if (!done.ok()) {
            return done;
        }
    }
    done = insertTogether(StoreTable::UploadMessage, messages_);
    return done.ok() ? insertTogether(StoreTable::AnalyticsEvent, events_) : done;
}

StoreResult StoreWriter::insertTogether(StoreTable table, std::span<StoreItem* const> items) {
    if (items.empty()) {
        return {};
    }
    const auto areIn = database_.insertTogether(table, items, inserted_);
    if (!areIn.ok()) {
        return areIn.failure();
    }
    for (std::size_t i = 0; i < items.size(); ++i) {
        if (areIn.value() && inserted_[i]) {
            shares_.note(*items[i], *inserted_[i]);
        } else if (StoreResult done = insertOne(*items[i]); !done.ok()) {
            return done;
        }
    }
    return {};
}

StoreResult StoreWriter::insertOne(StoreItem& item) {
    StoreResult inserted =
        std::visit([this](const auto& row) { return database_.insert(row); }, item.row);
    if (inserted.ok()) {
        shares_.note(item, database_.lastInserted());
        return inserted;
    }
    return refuse(item, std::move(inserted));
}

StoreResult StoreWriter::refuse(const StoreItem& item, StoreResult result) {
    if (!concernsOneRow(result.failure())) {
        return result;
    }
    rejected_.push_back(tableOf(item.row));
    rejection_ = result.failure().text;
    return {};
}

// What was built is kept in the row: its group may be written again.
void StoreWriter::buildPayload(StoreItem& item) {
    auto* const event = std::get_if<StoreAnalyticsRow>(&item.row);
    if (event != nullptr && !event->isBuilt()) {
        event->build();
        queue_->payloadsOf(item.client).note(storeBytes(event->built()));
    }
}

} // namespace halyard::linux_
