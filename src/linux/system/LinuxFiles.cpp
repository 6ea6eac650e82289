#include "linux/system/LinuxFiles.h"

#include <algorithm>
#include <sys/stat.h>

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

} // namespace halyard::linux_
