#include "reading/StoreCheck.h"

#include <cerrno>
#include <chrono>
#include <fmt/format.h>
#include <limits>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

#include "linux/store/Schema.h"
#include "linux/store/StoreDatabase.h"
#include "linux/store/StoreSalvage.h"

namespace halyard::reading {
namespace {

namespace fs = std::filesystem;
using linux_::StoreDatabase;
using linux_::StoreFailure;
using linux_::StoreStatement;

// Steps of SQLite's machine between two looks at how far it is.
constexpr int kStepsALook = 20'000;

std::uint64_t sizeOf(const fs::path& path) {
    std::error_code error;
    const auto size = fs::file_size(path, error);
    return error ? 0 : size;
}

// A check reads every page twice, as a part of its tree and for its rows, so pages that
// were read tell how far it is.
class PagesRead {
public:
    PagesRead(StoreReader& reader, const std::function<void(double)>& tell)
        : database_(reader.handle()), tell_(tell) {
        pages_ = 2 * static_cast<double>(pageCount(reader));
        sqlite3_progress_handler(
            database_, kStepsALook,
            [](void* self) {
                static_cast<PagesRead*>(self)->look();
                return 0;
            },
            this);
    }
    ~PagesRead() { sqlite3_progress_handler(database_, 0, nullptr, nullptr); }
    PagesRead(const PagesRead&) = delete;
    PagesRead& operator=(const PagesRead&) = delete;

private:
    static std::int64_t pageCount(StoreReader& reader) {
        const auto count = reader.integer("PRAGMA page_count");
        return count.ok() ? count.value().value_or(0) : 0;
    }
    void look() const {
        int now = 0;
        int highest = 0;
        sqlite3_db_status(database_, SQLITE_DBSTATUS_CACHE_MISS, &now, &highest, 0);
        tell_(pages_ > 0 ? now / pages_ : 0);
    }

    sqlite3* const database_;
    const std::function<void(double)>& tell_;
    double pages_ = 0;
};

std::vector<std::string> integrityOf(StoreReader& reader) {
    std::vector<std::string> texts;
    StoreStatement check;
    int code = check.prepare(reader.handle(), "PRAGMA integrity_check");
    while (code == SQLITE_OK || code == SQLITE_ROW) {
        code = check.step();
        if (code == SQLITE_ROW && check.text(0) != "ok") {
            texts.emplace_back(check.text(0));
        }
        if (code == SQLITE_OK) {
            break; // The end.
        }
    }
    if (code != SQLITE_OK && code != SQLITE_DONE) {
        texts.emplace_back(sqlite3_errmsg(reader.handle()));
    }
    return texts;
}

std::optional<std::int64_t> count(StoreReader& reader, const std::string& from,
                                  std::vector<std::string>& complaints) {
    const auto rows = reader.integer("SELECT count(*) FROM " + from);
    if (!rows.ok()) {
        complaints.push_back(fmt::format("{}: {}", from, sqlite3_errmsg(reader.handle())));
    }
    return rows.ok() ? rows.value() : std::nullopt;
}

Trouble inUse(const fs::path& path, std::int32_t process) {
    return {Exit::Failed,
            fmt::format("{} has {} open: stop the daemon first (systemctl stop halyardd.socket "
                        "halyardd.service)",
                        process > 0 ? fmt::format("process {}", process) : "another process",
                        path.native())};
}

Trouble troubleOf(const Failure& failure, const std::string& what) {
    const bool refused = failure.code == std::errc::permission_denied ||
                         failure.code == std::errc::operation_not_permitted ||
                         failure.code == std::errc::read_only_file_system;
    return {refused ? Exit::NotAllowed : Exit::Failed,
            fmt::format("{}: {}", what, failure.message())};
}

Trouble troubleOf(const StoreFailure& failure, const fs::path& path) {
    const bool refused = failure.primary() == SQLITE_READONLY || failure.primary() == SQLITE_PERM;
    return {refused ? Exit::NotAllowed : Exit::Failed,
            fmt::format("cannot write {}: {}", path.native(), failure.text)};
}

// The new file is its daemon's, whoever made it.
void handOver(const fs::path& path, const struct stat& owner) {
    if (::chown(path.c_str(), owner.st_uid, owner.st_gid) == 0 || ::geteuid() != 0) {
        (void)::chmod(path.c_str(), owner.st_mode & 0777);
    }
}

Outcome<void> removeWhole(const fs::path& path) {
    for (const char* const companion : {"", "-wal", "-shm"}) {
        std::error_code error;
        fs::remove(path.native() + companion, error);
        if (error) {
            return troubleOf({static_cast<std::errc>(error.value()), ""},
                             "cannot remove " + path.native());
        }
    }
    return {};
}

} // namespace

std::uint64_t bytesOfStore(const fs::path& path) {
    return sizeOf(path) + sizeOf(path.native() + "-wal");
}

Outcome<StoreCheck> checkStore(const fs::path& path, const std::function<void(double)>& progress) {
    StoreCheck check;
    check.bytes = bytesOfStore(path);
    auto opened = StoreReader::open(path);
    if (!opened.ok()) {
        if (!opened.failure().isDamage) {
            return opened.failure();
        }
        check.integrity.push_back(opened.failure().text);
        return check;
    }
    StoreReader& reader = opened.value();
    const PagesRead pages(reader, progress);
    check.schema = reader.schema();
    check.integrity = integrityOf(reader);
    for (const auto& table : linux_::kStoreSchema) {
        if (table.since > check.schema) {
            continue;
        }
        const std::string name(table.name);
        check.rows.emplace_back(name, count(reader, name, check.integrity));
    }
    check.unclosedSessions = count(reader, "upload_session WHERE closed IS NULL", check.integrity);
    check.ok = check.integrity.empty();
    return check;
}

bool isSound(StoreReader& reader) {
    StoreStatement quick;
    return quick.prepare(reader.handle(), "PRAGMA quick_check(1)") == SQLITE_OK &&
           quick.step() == SQLITE_ROW && quick.text(0) == "ok";
}

Outcome<StoreRepair> repairStore(const fs::path& path) {
    if (const auto holder = storeHolder(path)) {
        return inUse(path, *holder);
    }
    struct stat owner {};
    (void)::stat(path.c_str(), &owner);
    const auto aside = linux_::storeSetAside(path, std::chrono::system_clock::now());
    if (!aside.ok()) {
        return troubleOf(aside.failure(), "cannot set " + path.native() + " aside");
    }
    StoreDatabase fresh({path});
    if (const auto made = fresh.open(); !made.ok()) {
        return troubleOf(made.failure(), path);
    }
    const linux_::StoreSalvage salvage = linux_::storeCarryOver(aside.value(), fresh.handle());
    fresh.close();
    handOver(path, owner);
    if (!salvage.whole.ok()) {
        return troubleOf(salvage.whole.failure(), path);
    }
    return StoreRepair{aside.value(), salvage.carried, salvage.holes};
}

Outcome<std::uint64_t> purgeStore(const fs::path& path) {
    if (const auto holder = storeHolder(path)) {
        return inUse(path, *holder);
    }
    struct stat facts {};
    if (::stat(path.c_str(), &facts) != 0) {
        return errno == ENOENT ? Trouble(Exit::NothingThere, "no store at " + path.native())
                               : troubleOf(Failure::ofErrno(), path.native());
    }
    // An older schema is brought up on the way; a newer one is not touched.
    StoreDatabase database({path});
    auto done = database.open();
    Result<std::uint64_t, StoreFailure> purged = std::uint64_t{0};
    if (done.ok()) {
        // It takes no session for open that was there before it.
        purged = database.purge(platform::secondsSince1970(std::chrono::system_clock::now()));
        database.close();
        done = purged.ok() ? done : purged.failure();
    }
    if (done.ok()) {
        return purged.value();
    }
    if (!done.failure().isDamage()) {
        return troubleOf(done.failure(), path);
    }
    database.abandon();
    const auto removed = removeWhole(path);
    return removed.ok() ? Outcome<std::uint64_t>(std::uint64_t{0}) : removed.failure();
}

} // namespace halyard::reading
