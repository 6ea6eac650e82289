// A disk that a test can make fail or hang: SQLite's own file layer with a gate
// before every write and every sync of the write-ahead log, and one before reads.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <sqlite3.h>
#include <sys/stat.h>

namespace halyard::linux_ {

// One at a time: SQLite knows file layers by name, not by object.
class FaultyDisk {
public:
    static constexpr const char* kName = "halyard-faulty";

    FaultyDisk() {
        current() = this;
        real_ = sqlite3_vfs_find(nullptr);
        layer_ = *real_;
        layer_.zName = kName;
        layer_.szOsFile = static_cast<int>(sizeof(File)) + real_->szOsFile;
        layer_.xOpen = open;
        sqlite3_vfs_register(&layer_, 0);
    }
    ~FaultyDisk() { sqlite3_vfs_unregister(&layer_); }
    FaultyDisk(const FaultyDisk&) = delete;
    FaultyDisk& operator=(const FaultyDisk&) = delete;

    // What writing to the log answers from now on.
    void fail(int code) { code_ = code; }
    // What reading this file answers from now on, whatever its name will be.
    void failReadsOf(const std::filesystem::path& path) { unreadable_ = numberOf(path.c_str()); }
    void readAgain() { unreadable_ = 0; }
    // So many pages come as nonsense.
    void garble(int pages) { garbled_ = pages; }
    void hang() {
        const std::lock_guard lock(mutex_);
        hanging_ = true;
    }
    // Returns once an operation hangs.
    void waitForVictim() {
        std::unique_lock lock(mutex_);
        changed_.wait(lock, [this] { return caught_; });
    }
    void goOn() {
        const std::lock_guard lock(mutex_);
        hanging_ = false;
        changed_.notify_all();
    }

private:
    struct File {
        sqlite3_file base;
        sqlite3_io_methods methods;
        std::uint64_t number; // of the file in its file system
    };

    static FaultyDisk*& current() {
        static FaultyDisk* disk = nullptr;
        return disk;
    }
    static sqlite3_file* realOf(sqlite3_file* file) {
        return reinterpret_cast<sqlite3_file*>(reinterpret_cast<char*>(file) + sizeof(File));
    }
    int gate() {
        std::unique_lock lock(mutex_);
        caught_ = hanging_;
        changed_.notify_all();
        changed_.wait(lock, [this] { return !hanging_; });
        return code_;
    }

    // Every method but two goes straight to the real file, by way of a copy of
    // its table whose entries find the real file behind ours.
    template <auto Method, class... Arguments>
    static int pass(sqlite3_file* file, Arguments... arguments) {
        sqlite3_file* real = realOf(file);
        return (real->pMethods->*Method)(real, arguments...);
    }
    static void passBarrier(sqlite3_file* file) {
        realOf(file)->pMethods->xShmBarrier(realOf(file));
    }
    static std::uint64_t numberOf(const char* name) {
        struct stat status {};
        return name != nullptr && ::stat(name, &status) == 0 ? status.st_ino : 0;
    }
    static int read(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset) {
        FaultyDisk& disk = *current();
        const std::uint64_t number = reinterpret_cast<File*>(file)->number;
        if (number != 0 && number == disk.unreadable_) {
            return SQLITE_IOERR_READ;
        }
        const int code = pass<&sqlite3_io_methods::xRead>(file, bytes, count, offset);
        if (code == SQLITE_OK && offset > 0 && disk.garbled_ > 0) {
            --disk.garbled_;
            std::memset(bytes, 0xA5, static_cast<std::size_t>(count));
        }
        return code;
    }
    static int write(sqlite3_file* file, const void* bytes, int count, sqlite3_int64 offset) {
        const int code = current()->gate();
        return code != SQLITE_OK ? code
                                 : pass<&sqlite3_io_methods::xWrite>(file, bytes, count, offset);
    }
    static int sync(sqlite3_file* file, int flags) {
        const int code = current()->gate();
        return code != SQLITE_OK ? code : pass<&sqlite3_io_methods::xSync>(file, flags);
    }
    static int open(sqlite3_vfs*, sqlite3_filename name, sqlite3_file* file, int flags, int* out) {
        FaultyDisk& disk = *current();
        sqlite3_file* real = realOf(file);
        file->pMethods = nullptr;
        const int code = disk.real_->xOpen(disk.real_, name, real, flags, out);
        if (real->pMethods == nullptr) {
            return code;
        }
        using M = sqlite3_io_methods;
        const bool log = (flags & SQLITE_OPEN_WAL) != 0;
        sqlite3_io_methods& methods = reinterpret_cast<File*>(file)->methods;
        methods = {real->pMethods->iVersion,
                   pass<&M::xClose>,
                   read,
                   log ? write : pass<&M::xWrite, const void*, int, sqlite3_int64>,
                   pass<&M::xTruncate>,
                   log ? sync : pass<&M::xSync, int>,
                   pass<&M::xFileSize>,
                   pass<&M::xLock>,
                   pass<&M::xUnlock>,
                   pass<&M::xCheckReservedLock>,
                   pass<&M::xFileControl>,
                   pass<&M::xSectorSize>,
                   pass<&M::xDeviceCharacteristics>,
                   pass<&M::xShmMap>,
                   pass<&M::xShmLock>,
                   passBarrier,
                   pass<&M::xShmUnmap>,
                   pass<&M::xFetch>,
                   pass<&M::xUnfetch>};
        file->pMethods = &methods;
        reinterpret_cast<File*>(file)->number = numberOf(name);
        return code;
    }

    sqlite3_vfs* real_ = nullptr;
    sqlite3_vfs layer_{};
    std::atomic<int> code_{SQLITE_OK};
    std::atomic<std::uint64_t> unreadable_{0};
    std::atomic<int> garbled_{0};
    std::mutex mutex_;
    std::condition_variable changed_;
    bool hanging_ = false;
    bool caught_ = false;
};

} // namespace halyard::linux_
