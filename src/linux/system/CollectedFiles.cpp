#include "linux/system/CollectedFiles.h"

#include <fmt/format.h>
#include <string>
#include <system_error>
#include <vector>

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

Result<void> removeAll(const std::vector<fs::path>& paths) {
    Result<void> result;
    for (const fs::path& path : paths) {
        const Result<void> removed = removeWhole(path);
        result = result.ok() ? removed : result;
    }
    return result;
}

} // namespace

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

Result<void> removeCollectedLogs(const fs::path& logs) {
    return removeAll({logs / kSummariesFolder, logs / kTracesFolder});
}

} // namespace halyard::linux_
