// A layer over SQLite's own files for the database that the daemon writes: what goes to
// neighbouring places of its log is written at once.
//
// SQLite writes a page at a time, and its place in the log by itself, which costs the
// kernel about as much as sixteen of them. It relies on nothing in the log that it has not
// synced, and neither do other programs: pages in it count once its index says so, which
// comes after a sync. So what is gathered is written before a sync and before anybody here
// looks, and forgotten with a file that is closed without one.
//
// Nothing is gathered for the file itself: where a reader keeps part of the log from being
// moved into it, others look into the file for what was moved, and there is no sync before.
//
// Not thread-safe, like the connection that uses it; must outlive that.
#pragma once

#include <cstddef>
#include <sqlite3.h>
#include <string>

namespace halyard::linux_ {

class StoreDisk {
public:
    static constexpr std::size_t kGathered = std::size_t{64} * 1024;

    // Over the layer of that name, or SQLite's default.
    explicit StoreDisk(const char* below);
    ~StoreDisk();
    StoreDisk(const StoreDisk&) = delete;
    StoreDisk& operator=(const StoreDisk&) = delete;

    // For sqlite3_open_v2().
    const char* name() const { return name_.c_str(); }

private:
    static int open(sqlite3_vfs* self, sqlite3_filename name, sqlite3_file* file, int flags,
                    int* flagsOut);

    const std::string name_;
    sqlite3_vfs* const below_;
    sqlite3_vfs layer_{};
};

} // namespace halyard::linux_
