#include "linux/system/CollectedFiles.h"

#include <fmt/format.h>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

#include "linux/system/PrivateFiles.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kSummariesFolder = "Reporting";
constexpr const char* kTracesFolder = "Traces";

Result<void> removeWhole(const fs::path& path) {
    std::error_code error;
    fs::remove_all(path, error);
    if (error) {
        return Failure{static_cast<std::errc>(error.value()),
                       fmt::format("cannot remove {}", path.native())};
    }
    return {};
}

// The first failure, but for what has gone meanwhile or never was.
void add(Result<void>& result, const Result<void>& next) {
    const bool absent = !next.ok() && next.failure().code == std::errc::no_such_file_or_directory;
    result = result.ok() && !absent ? next : result;
}

// A directory may be reached by a link of the operator's; what is in it may not.
fs::path realPath(const fs::path& directory) {
    std::error_code error;
    fs::path real = fs::canonical(directory, error);
    return error ? directory : real;
}

Result<void> removeAll(const std::vector<fs::path>& paths) {
    Result<void> result;
    for (const fs::path& path : paths) {
        const Result<void> removed = removeWhole(path);
        result = result.ok() ? removed : result;
    }
    return result;
}

bool isNumber(std::string_view text) {
    return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

// ".name.PID-N", see AtomicFile.
bool isTemporaryName(std::string_view name) {
    const std::size_t dot = name.rfind('.');
    if (!name.starts_with('.') || dot < 2) {
        return false;
    }
    const std::string_view numbers = name.substr(dot + 1);
    const std::size_t dash = numbers.find('-');
    return dash != std::string_view::npos && isNumber(numbers.substr(0, dash)) &&
           isNumber(numbers.substr(dash + 1));
}

bool isTemporary(const fs::directory_entry& entry) {
    std::error_code ignored;
    return entry.symlink_status(ignored).type() == fs::file_type::regular &&
           isTemporaryName(entry.path().filename().native());
}

void removeTemporaries(const fs::path& tree) {
    std::vector<fs::path> found;
    std::error_code error;
    for (auto entry = fs::recursive_directory_iterator(tree, error);
         !error && entry != fs::recursive_directory_iterator(); entry.increment(error)) {
        if (isTemporary(*entry)) {
            found.push_back(entry->path());
        }
    }
    (void)removeAll(found);
}

} // namespace

Result<void> keepStorePrivate(const fs::path& state) {
    Result<void> result;
    std::error_code error;
    for (const fs::directory_entry& entry : fs::directory_iterator(state, error)) {
        if (entry.path().filename().native().starts_with(kStoreFile)) {
            add(result, keepPrivate(entry.path()));
        }
    }
    return result;
}

Result<void> keepCollectedPrivate(const fs::path& state, const fs::path& logs) {
    Result<void> result;
    for (const fs::path& directory : {state, logs}) {
        add(result, keepPrivate(realPath(directory)));
    }
    add(result, keepStorePrivate(state));
    for (const fs::path& tree :
         {state / kIncidentsFolder, logs / kSummariesFolder, logs / kTracesFolder}) {
        add(result, keepTreePrivate(tree));
    }
    return result;
}

Result<void> removeCollectedState(const fs::path& state) {
    std::vector<fs::path> paths = {state / kIncidentsFolder};
    const std::string prefix = std::string(kStoreFile) + ".damaged-";
    std::error_code ignored;
    for (const fs::directory_entry& entry : fs::directory_iterator(state, ignored)) {
        if (entry.path().filename().native().starts_with(prefix)) {
            paths.push_back(entry.path());
        }
    }
    return removeAll(paths);
}

void removeUnfinished(const fs::path& state, const fs::path& logs) {
    (void)removeWhole(state / kIncidentsFolder / kUnfinishedIncident);
    removeTemporaries(logs / kSummariesFolder);
    removeTemporaries(logs / kTracesFolder);
}

Result<void> removeCollectedLogs(const fs::path& logs) {
    return removeAll({logs / kSummariesFolder, logs / kTracesFolder});
}

} // namespace halyard::linux_
