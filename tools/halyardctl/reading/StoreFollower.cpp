#include "reading/StoreFollower.h"

#include <fmt/format.h>
#include <utility>

namespace halyard::reading {

StoreFollower::StoreFollower(StoreReader reader, std::string table, std::string columns,
                             std::string condition)
    : path_(reader.path()), reader_(std::move(reader)), table_(std::move(table)),
      columns_(std::move(columns)), condition_(std::move(condition)) {}

Outcome<StoreFollower> StoreFollower::open(const std::filesystem::path& path, std::string table,
                                           std::string columns, std::string condition) {
    auto reader = StoreReader::open(path);
    if (!reader.ok()) {
        return reader.failure();
    }
    StoreFollower follower(std::move(reader).value(), std::move(table), std::move(columns),
                           std::move(condition));
    const auto last = follower.newest();
    if (!last.ok()) {
        return last.failure();
    }
    follower.last_ = last.value();
    return follower;
}

Outcome<std::int64_t> StoreFollower::newest() {
    const auto id = reader_->integer(fmt::format("SELECT max(id) FROM {}", table_));
    return id.ok() ? Outcome<std::int64_t>(id.value().value_or(0)) : id.failure();
}

Outcome<bool> StoreFollower::reopenIfNeeded() {
    if (reader_ && !reader_->isOutdated()) {
        return true;
    }
    reader_.reset();
    auto reader = StoreReader::open(path_);
    if (!reader.ok()) {
        return reader.failure().exit == Exit::NothingThere ? Outcome<bool>(false)
                                                           : reader.failure();
    }
    reader_.emplace(std::move(reader).value());
    return true;
}

Outcome<void> StoreFollower::look(const Take& take) {
    const auto open = reopenIfNeeded();
    if (!open.ok()) {
        return open.failure();
    }
    if (!open.value()) {
        return {};
    }
    const auto highest = newest();
    if (!highest.ok()) {
        // What is damaged under our eyes may be replaced at any moment.
        return reader_->isOutdated() ? Outcome<void>() : highest.failure();
    }
    // Ids begin anew in a table that was emptied before its daemon started.
    last_ = highest.value() < last_ ? 0 : last_;
    if (highest.value() == last_) {
        return {};
    }
    return reader_->forEach(
        {table_, columns_, condition_, std::exchange(last_, highest.value()), highest.value()},
        [&](const Row& row) { return take(*reader_, row); });
}

} // namespace halyard::reading
