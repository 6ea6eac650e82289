#include "linux/config/SettingsFiles.h"

#include <algorithm>
#include <fmt/format.h>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

bool isMissing(const Failure& failure) {
    return failure.code == std::errc::no_such_file_or_directory ||
           failure.code == std::errc::not_a_directory;
}

SettingsFailure failureOf(const fs::path& path, Failure why) {
    return {std::move(why), path};
}

Failure failureOf(const std::error_code& error) {
    return {static_cast<std::errc>(error.value())};
}

// In order of their names, byte by byte.
Result<std::vector<fs::path>, SettingsFailure> dropInsOf(const fs::path& folder) {
    std::error_code error;
    std::vector<fs::path> found;
    fs::directory_iterator entries(folder, error);
    if (error == std::errc::no_such_file_or_directory) {
        return found;
    }
    for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
        if (!isDropIn(entries->path().filename().native())) {
            continue;
        }
        if (found.size() == kMaxDropIns) {
            return failureOf(folder, {{}, fmt::format("more than {} files", kMaxDropIns)});
        }
        found.push_back(entries->path());
    }
    if (error) {
        return failureOf(folder, failureOf(error));
    }
    std::sort(found.begin(), found.end());
    return found;
}

// None: the file may be taken, or is not there.
std::optional<SettingsFailure> addFile(const fs::path& path, bool isDropIn,
                                       LoadedSettings& loaded) {
    const auto text = readSmallFile(path, kMaxSettingsBytes);
    if (!text.ok()) {
        return isMissing(text.failure()) ? std::nullopt
                                         : std::optional(failureOf(path, text.failure()));
    }
    auto parsed = parseSettings(text.value(), path.native(), std::move(loaded.settings));
    if (!parsed.ok()) {
        return parsed.failure();
    }
    ParsedSettings& file = parsed.value();
    loaded.settings = std::move(file.settings);
    loaded.files.push_back(
        {path, isDropIn, std::move(file.warnings), file.warningsLeftOut, std::move(file.given)});
    return std::nullopt;
}

} // namespace

bool isDropIn(std::string_view name) {
    return name.ends_with(".toml") && !name.starts_with('.');
}

const LoadedSettings::File* LoadedSettings::decidingFile(std::string_view key) const {
    const auto last = std::find_if(files.rbegin(), files.rend(),
                                   [&](const File& file) { return file.given.contains(key); });
    return last == files.rend() ? nullptr : &*last;
}

Result<LoadedSettings, SettingsFailure> loadSettings(const fs::path& directory) {
    const auto dropIns = dropInsOf(directory / kDropInFolder);
    if (!dropIns.ok()) {
        return dropIns.failure();
    }
    LoadedSettings loaded;
    auto failure = addFile(directory / kSettingsFile, false, loaded);
    for (const fs::path& file : dropIns.value()) {
        failure = failure ? std::move(failure) : addFile(file, true, loaded);
    }
    if (failure) {
        return std::move(*failure);
    }
    return loaded;
}

} // namespace halyard::linux_
