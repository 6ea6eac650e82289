// The files that settle the configuration, read as one: halyard.toml, then the drop-ins
// halyard.d/*.toml in order of their names, each winning over what came before it.
//
// Functions of the directory alone, so that whoever asks what is in force (the daemon,
// and what shows or changes a setting beside it) gets the same answer. Any thread.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "linux/config/Settings.h"

namespace halyard::linux_ {

inline constexpr std::string_view kSettingsFile = "halyard.toml";
inline constexpr std::string_view kDropInFolder = "halyard.d";
inline constexpr std::size_t kMaxDropIns = 64;
// A larger file is refused unread.
inline constexpr std::size_t kMaxSettingsBytes = 1024 * 1024;

// Whether a file of this name counts as a drop-in: "*.toml", but for hidden ones, which
// are what editors and unfinished writers leave.
[[nodiscard]] bool isDropIn(std::string_view name);

struct LoadedSettings {
    struct File {
        std::filesystem::path path;
        bool isDropIn = false;
        std::vector<SettingsWarning> warnings;
        std::size_t warningsLeftOut = 0;
        std::set<std::string, std::less<>> given; // the keys that it has
    };
    Settings settings;
    std::vector<File> files; // those that are there, in their order

    // The file that settles `key`, "export.consent"; none when it has its default.
    [[nodiscard]] const File* decidingFile(std::string_view key) const;
};

// Files that are missing count as empty. The failure is that of the first file that
// cannot be taken.
Result<LoadedSettings, SettingsFailure> loadSettings(const std::filesystem::path& directory);

} // namespace halyard::linux_
