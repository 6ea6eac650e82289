// New rows of a table, as they are committed.
//
// The store is looked at anew now and then: SQLite tells nobody of a commit, and a look
// at a store where nothing happened costs some microseconds. When the file is replaced,
// or a daemon begins to write to one that nobody had open, it is opened again; while
// there is none, that is waited for.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>

#include "reading/StoreReader.h"

namespace halyard::reading {

class StoreFollower {
public:
    // How often to look, so that rows are there well within 200 ms of their commit.
    static constexpr int kMilliseconds = 50;

    // What is in the table by now is not new. Fails where there is no store.
    static Outcome<StoreFollower> open(const std::filesystem::path& path, std::string table,
                                       std::string columns, std::string condition);

    // Gives the rows since the last look. The reader is for what belongs to them.
    using Take = std::function<bool(StoreReader&, const Row&)>;
    Outcome<void> look(const Take& take);

private:
    StoreFollower(StoreReader reader, std::string table, std::string columns,
                  std::string condition);
    Outcome<std::int64_t> newest();
    // Whether there is a store to look at.
    Outcome<bool> reopenIfNeeded();

    std::filesystem::path path_;
    std::optional<StoreReader> reader_;
    std::string table_;
    std::string columns_;
    std::string condition_;
    std::int64_t last_ = 0;
};

} // namespace halyard::reading
