#include "linux/system/LinuxFiles.h"

#include <algorithm>
#include <fmt/format.h>
#include <sys/stat.h>
#include <vector>

#include "linux/system/AtomicFile.h"
#include "linux/system/PrivateFiles.h"
#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

// Done when the directory is there afterwards.
Result<void> makeDirectory(const fs::path& path, mode_t mode) {
    if (::mkdir(path.c_str(), mode) == 0) {
        return {};
    }
    const Failure failure = Failure::ofErrno();
    std::error_code ignored;
    return fs::is_directory(path, ignored) ? Result<void>() : failure;
}

// "name-2.json" where there is a "name.json".
fs::path freeName(const std::string& path) {
    const fs::path wanted(path);
    fs::path name = wanted;
    std::error_code ignored;
    for (int i = 2; fs::exists(fs::symlink_status(name, ignored)); ++i) {
        name = wanted.parent_path() /
               fmt::format("{}-{}{}", wanted.stem().string(), i, wanted.extension().string());
    }
    return name;
}

struct Added {
    fs::path path;
    fs::file_time_type time;
    std::uintmax_t bytes;
};

std::vector<Added> newestFirst(const fs::path& directory) {
    std::vector<Added> files;
    std::error_code ignored;
    for (const fs::directory_entry& entry : fs::directory_iterator(directory, ignored)) {
        if (entry.symlink_status(ignored).type() == fs::file_type::regular &&
            !entry.path().filename().native().starts_with('.')) {
            files.push_back(
                {entry.path(), entry.last_write_time(ignored), entry.file_size(ignored)});
        }
    }
    std::sort(files.begin(), files.end(),
              [](const Added& a, const Added& b) { return a.time > b.time; });
    return files;
}

// The newest stays, however large it is.
void removeOldest(const fs::path& directory) {
    const std::vector<Added> files = newestFirst(directory);
    std::uintmax_t bytes = 0;
    for (std::size_t i = 0; i < files.size(); ++i) {
        bytes += files[i].bytes;
        if (i >= LinuxFiles::kMostAdded || (i > 0 && bytes > LinuxFiles::kMostAddedBytes)) {
            std::error_code ignored;
            fs::remove(files[i].path, ignored);
        }
    }
}

} // namespace

Error systemError(const Failure& failure) {
    return {"posix", static_cast<std::int64_t>(failure.code), failure.message()};
}

std::variant<std::string, Error> LinuxFiles::readFile(std::string_view path,
                                                      std::size_t most) const {
    auto result = readSmallFile(directories_.mapped(path), most);
    if (!result.ok()) {
        return systemError(result.failure());
    }
    return std::move(result).value();
}

std::string LinuxFiles::currentDirectory() const {
    std::error_code error;
    const fs::path path = fs::current_path(error);
    return error ? "/" : path.string();
}

std::string LinuxFiles::located(std::string_view path) const {
    return directories_.mapped(path).string();
}

// Below the logs directory all is the daemon's.
bool LinuxFiles::isOwn(const fs::path& path) const {
    const auto& logs = directories_.logs;
    const auto [end, rest] = std::mismatch(logs.begin(), logs.end(), path.begin(), path.end());
    return end == logs.end() && rest != path.end();
}

MaybeError LinuxFiles::createDirectories(std::string_view path, std::uint32_t mode) {
    fs::path made;
    for (const fs::path& part : directories_.mapped(path)) {
        made /= part;
        if (part.empty() || part == "/") {
            continue; // A trailing slash, the root.
        }
        const auto result = isOwn(made) ? makePrivateDirectory(made)
                                        : makeDirectory(made, static_cast<mode_t>(mode));
        if (!result.ok()) {
            return systemError(result.failure());
        }
    }
    return std::nullopt;
}

MaybeError LinuxFiles::writeFileAtomically(std::string_view path, std::string_view contents) {
    const fs::path place = directories_.mapped(path);
    if (isOwn(place)) {
        if (const auto real = refuseLink(place.parent_path()); !real.ok()) {
            return systemError(real.failure());
        }
    }
    AtomicFile file(place);
    file.write(contents);
    const auto result = file.commit();
    return result.ok() ? MaybeError() : systemError(result.failure());
}

std::variant<std::string, Error> LinuxFiles::addFile(std::string_view path,
                                                     std::string_view contents) {
    const MutexLock lock(adding_);
    const std::string free = freeName(directories_.mapped(path)).string();
    if (const MaybeError error = writeFileAtomically(free, contents)) {
        return *error;
    }
    removeOldest(fs::path(free).parent_path());
    return free;
}

} // namespace halyard::linux_
