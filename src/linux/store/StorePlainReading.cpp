#include <cstddef>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "linux/store/StoreSalvage.h"

// By SQLite's own file layer, because a descriptor of anybody else's that is closed takes
// all of SQLite's locks on that file with it.
namespace halyard::linux_ {
namespace {

constexpr int kChunk = 64 * 1024;

int readToItsEnd(sqlite3_file* file) {
    sqlite3_int64 size = 0;
    int code = file->pMethods->xFileSize(file, &size);
    std::vector<char> chunk(kChunk);
    for (sqlite3_int64 at = 0; code == SQLITE_OK && at < size; at += kChunk) {
        code = file->pMethods->xRead(file, chunk.data(), kChunk, at);
        code = code == SQLITE_IOERR_SHORT_READ ? SQLITE_OK : code; // behind the end
    }
    return code;
}

int readFile(sqlite3_vfs& vfs, const char* name, int kind) {
    int exists = 0;
    if (vfs.xAccess(&vfs, name, SQLITE_ACCESS_EXISTS, &exists) == SQLITE_OK && exists == 0) {
        return SQLITE_OK;
    }
    const auto memory = std::make_unique<std::max_align_t[]>(
        static_cast<std::size_t>(vfs.szOsFile) / sizeof(std::max_align_t) + 1);
    auto* const file = reinterpret_cast<sqlite3_file*>(memory.get());
    int code = vfs.xOpen(&vfs, name, file, SQLITE_OPEN_READONLY | kind, nullptr);
    code = code == SQLITE_OK ? readToItsEnd(file) : code;
    if (file->pMethods != nullptr) {
        file->pMethods->xClose(file);
    }
    return code;
}

} // namespace

int storeReadPlainly(const std::filesystem::path& path, const char* name) {
    sqlite3_vfs* const vfs = sqlite3_vfs_find(name);
    const std::string log = path.string() + "-wal";
    const sqlite3_filename names =
        sqlite3_create_filename(path.c_str(), "", log.c_str(), 0, nullptr);
    if (vfs == nullptr || names == nullptr) {
        return SQLITE_NOMEM;
    }
    int code = readFile(*vfs, names, SQLITE_OPEN_MAIN_DB);
    code = code == SQLITE_OK ? readFile(*vfs, sqlite3_filename_wal(names), SQLITE_OPEN_WAL) : code;
    sqlite3_free_filename(names);
    return code;
}

} // namespace halyard::linux_
