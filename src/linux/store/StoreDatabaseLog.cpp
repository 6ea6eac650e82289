// What of StoreDatabase has to do with the files beside the database's own.
#include <filesystem>
#include <string>
#include <sys/stat.h>

#include "linux/store/StoreDatabase.h"

namespace halyard::linux_ {
namespace {

constexpr std::array<const char*, 2> kCompanionNames = {"-wal", "-shm"};

} // namespace

bool StoreDatabase::hasMoved() {
    int moved = 0;
    return database_ != nullptr &&
           sqlite3_file_control(database_, "main", SQLITE_FCNTL_HAS_MOVED, &moved) == SQLITE_OK &&
           moved != 0;
}

StoreDatabase::Companions StoreDatabase::companionsAtPath() const {
    Companions found{};
    for (std::size_t i = 0; i < found.size(); ++i) {
        struct stat status {};
        if (::stat((settings_.path.string() + kCompanionNames[i]).c_str(), &status) == 0) {
            found[i] = {status.st_dev, status.st_ino};
        }
    }
    return found;
}

bool StoreDatabase::hasLostLog() const {
    return database_ != nullptr && companionsAtPath() != companions_;
}

// What lies at the log's path by then is none that this file may be given back: its
// pages are older than those that have just been moved.
StoreResult StoreDatabase::saveLostLog() {
    const int code =
        sqlite3_wal_checkpoint_v2(database_, nullptr, SQLITE_CHECKPOINT_FULL, nullptr, nullptr);
    if (code != SQLITE_OK) {
        return failureOf(code);
    }
    abandon();
    for (const char* const name : kCompanionNames) {
        std::error_code absent;
        std::filesystem::remove(settings_.path.string() + name, absent);
    }
    return {};
}

StoreResult StoreDatabase::boundLog(std::uint64_t maxBytes, std::uint64_t checkpointBytes) {
    const std::uint64_t step = checkpointBytes / pageSize_;
    if (logPages_ < step || logPages_ < triedLogPages_ + step / 4) {
        return {};
    }
    const bool tooLong = logBytes() > maxBytes;
    const int mode = tooLong ? SQLITE_CHECKPOINT_TRUNCATE : SQLITE_CHECKPOINT_PASSIVE;
    int logged = 0;
    int moved = 0;
    const int code = sqlite3_wal_checkpoint_v2(database_, nullptr, mode, &logged, &moved);
    if (tooLong) {
        if (code == SQLITE_OK) {
            logPages_ = triedLogPages_ = 0;
        }
        return resultOf(code);
    }
    // Once all of it has moved, the next commit begins the log anew.
    triedLogPages_ = code == SQLITE_OK && logged == moved ? 0 : logPages_;
    if (triedLogPages_ == 0) {
        logPages_ = 0;
    }
    return resultOf(code == SQLITE_BUSY ? SQLITE_OK : code);
}

} // namespace halyard::linux_
