#include "linux/store/StoreDisk.h"

#include <algorithm>
#include <atomic>
#include <memory>
#include <utility>
#include <vector>

namespace halyard::linux_ {
namespace {

struct Gathered {
    std::vector<char> bytes;
    sqlite3_int64 at = 0;

    // Whether they go on where the others end.
    bool takes(int count, sqlite3_int64 offset) const {
        return bytes.size() + static_cast<std::size_t>(count) <= StoreDisk::kGathered &&
               (bytes.empty() || at + static_cast<sqlite3_int64>(bytes.size()) == offset);
    }
};

// What SQLite knows as the file; the file of the layer below follows it in memory.
struct File {
    sqlite3_file base;
    sqlite3_io_methods methods;
    Gathered* gathered; // Its own; null where nothing is gathered.
};

std::string nextName() {
    static std::atomic<unsigned> made{0};
    return "halyard-store-" + std::to_string(made++);
}

sqlite3_file* realOf(sqlite3_file* file) {
    return reinterpret_cast<sqlite3_file*>(reinterpret_cast<char*>(file) + sizeof(File));
}
Gathered* gatheredOf(sqlite3_file* file) {
    return reinterpret_cast<File*>(file)->gathered;
}

// What fails is as lost as if its own writing had failed, of which SQLite is told now.
int flush(sqlite3_file* file) {
    Gathered* const gathered = gatheredOf(file);
    if (gathered == nullptr || gathered->bytes.empty()) {
        return SQLITE_OK;
    }
    sqlite3_file* const real = realOf(file);
    const int code = real->pMethods->xWrite(real, gathered->bytes.data(),
                                            static_cast<int>(gathered->bytes.size()), gathered->at);
    gathered->bytes.clear();
    return code;
}

template <auto Method, class... Arguments> int pass(sqlite3_file* file, Arguments... arguments) {
    sqlite3_file* const real = realOf(file);
    return (real->pMethods->*Method)(real, arguments...);
}
template <auto Method, class... Arguments>
int flushAndPass(sqlite3_file* file, Arguments... arguments) {
    const int code = flush(file);
    return code == SQLITE_OK ? pass<Method>(file, arguments...) : code;
}
void passBarrier(sqlite3_file* file) {
    realOf(file)->pMethods->xShmBarrier(realOf(file));
}

int write(sqlite3_file* file, const void* bytes, int count, sqlite3_int64 offset) {
    Gathered& gathered = *gatheredOf(file);
    if (!gathered.takes(count, offset)) {
        if (const int code = flush(file); code != SQLITE_OK) {
            return code;
        }
        if (!gathered.takes(count, offset)) {
            return pass<&sqlite3_io_methods::xWrite>(file, bytes, count, offset);
        }
    }
    if (gathered.bytes.empty()) {
        gathered.at = offset;
    }
    const char* const begin = static_cast<const char*>(bytes);
    gathered.bytes.insert(gathered.bytes.end(), begin, begin + count);
    return SQLITE_OK;
}

int close(sqlite3_file* file) {
    const std::unique_ptr<Gathered> forgotten(
        std::exchange(reinterpret_cast<File*>(file)->gathered, nullptr));
    return pass<&sqlite3_io_methods::xClose>(file);
}

// Without xFetch(): whoever maps a file would not see what is gathered.
sqlite3_io_methods methodsFor(const sqlite3_file& real, bool gathers) {
    using M = sqlite3_io_methods;
    return {std::min(real.pMethods->iVersion, 2),
            close,
            flushAndPass<&M::xRead, void*, int, sqlite3_int64>,
            gathers ? write : pass<&M::xWrite, const void*, int, sqlite3_int64>,
            flushAndPass<&M::xTruncate, sqlite3_int64>,
            flushAndPass<&M::xSync, int>,
            flushAndPass<&M::xFileSize, sqlite3_int64*>,
            pass<&M::xLock, int>,
            pass<&M::xUnlock, int>,
            pass<&M::xCheckReservedLock, int*>,
            pass<&M::xFileControl, int, void*>,
            pass<&M::xSectorSize>,
            pass<&M::xDeviceCharacteristics>,
            pass<&M::xShmMap, int, int, int, void volatile**>,
            pass<&M::xShmLock, int, int, int>,
            passBarrier,
            pass<&M::xShmUnmap, int>,
            nullptr,
            nullptr};
}

} // namespace

StoreDisk::StoreDisk(const char* below) : name_(nextName()), below_(sqlite3_vfs_find(below)) {
    if (below_ != nullptr) {
        layer_ = *below_;
        layer_.zName = name_.c_str();
        layer_.szOsFile = static_cast<int>(sizeof(File)) + below_->szOsFile;
        layer_.pAppData = below_;
        layer_.xOpen = open;
        sqlite3_vfs_register(&layer_, 0);
    }
}

StoreDisk::~StoreDisk() {
    if (below_ != nullptr) {
        sqlite3_vfs_unregister(&layer_);
    }
}

int StoreDisk::open(sqlite3_vfs* self, sqlite3_filename name, sqlite3_file* file, int flags,
                    int* flagsOut) {
    auto* const below = static_cast<sqlite3_vfs*>(self->pAppData);
    auto* const ours = reinterpret_cast<File*>(file);
    sqlite3_file* const real = realOf(file);
    file->pMethods = nullptr;
    ours->gathered = nullptr;
    const int code = below->xOpen(below, name, real, flags, flagsOut);
    if (real->pMethods == nullptr) {
        return code;
    }
    const bool gathers = (flags & SQLITE_OPEN_WAL) != 0;
    if (gathers && code == SQLITE_OK) {
        ours->gathered = new Gathered;
    }
    ours->methods = methodsFor(*real, ours->gathered != nullptr);
    file->pMethods = &ours->methods;
    return code;
}

} // namespace halyard::linux_
