// The configuration file that is installed: "#key = value" shows a default, "#   key =
// value" an example, and without "#" stands what the package sets on purpose.

#include <gtest/gtest.h>

#include <chrono>
#include <fstream>
#include <sstream>
#include <string>

#include "linux/config/Settings.h"

namespace halyard::linux_ {
namespace {

constexpr std::string_view kExample = "#   ";

std::string packaged() {
    std::ifstream file(HALYARD_PACKAGED_CONFIGURATION);
    return {std::istreambuf_iterator<char>(file), {}};
}

bool isDefault(std::string_view line) {
    return line.size() > 1 && line[0] == '#' && line[1] != ' ';
}

std::string uncommented(bool examples) {
    std::istringstream lines(packaged());
    std::string result;
    for (std::string line; std::getline(lines, line);) {
        const bool shown = isDefault(line) || (examples && line.starts_with(kExample));
        const bool comment = line.starts_with("#") && !shown;
        result += comment ? "\n" : line.substr(shown ? 1 : 0) + "\n"; // Mistakes keep their line.
    }
    return result;
}

ParsedSettings parsed(const std::string& text) {
    auto result = parseSettings(text, "halyard.toml");
    EXPECT_TRUE(result.ok()) << (result.ok() ? "" : result.failure().message()) << "\n" << text;
    return result.ok() ? std::move(result).value() : ParsedSettings{};
}

// A domain without preferences is none, and a switch that is off is one that is not set.
Settings byMeaning(Settings settings) {
    std::erase_if(settings.preferences, [](const auto& domain) { return domain.second.empty(); });
    for (auto& [domain, flags] : settings.featureFlags) {
        std::erase_if(flags, [](const auto& flag) { return !flag.second; });
    }
    std::erase_if(settings.featureFlags, [](const auto& domain) { return domain.second.empty(); });
    std::erase_if(settings.deviceProperties, [](const auto& each) { return !each.second; });
    return settings;
}

Settings setOnPurpose() {
    Settings settings;
    settings.sessions.recount = true;
    settings.store.syncInterval = std::chrono::seconds(5);
    return settings;
}

// Whether a line of the file gives `key`, "store.max_age", a value or begins its table.
bool shows(const std::string& file, const std::string& key) {
    const std::size_t dot = key.rfind('.');
    const std::string name = dot == std::string::npos ? key : key.substr(dot + 1);
    return file.find("\n#" + name + " = ") != std::string::npos ||
           file.find("\n#   " + name + " = ") != std::string::npos ||
           file.find("\n" + name + " = ") != std::string::npos ||
           file.find("[" + key) != std::string::npos;
}

TEST(PackagedConfiguration, ChangesOnlyWhatItMeansTo) {
    const ParsedSettings settings = parsed(packaged());

    EXPECT_EQ(settings.settings, setOnPurpose());
}

TEST(PackagedConfiguration, ShowsTheDefaults) {
    const ParsedSettings settings = parsed(uncommented(false));

    EXPECT_EQ(byMeaning(settings.settings), setOnPurpose());
    EXPECT_EQ(settings.warnings, std::vector<SettingsWarning>());
}

TEST(PackagedConfiguration, ShowsExamplesThatAreTaken) {
    const ParsedSettings settings = parsed(uncommented(true));

    EXPECT_EQ(settings.warnings, std::vector<SettingsWarning>());
    EXPECT_EQ(settings.settings.driverChannels.size(), 1u);
}

TEST(PackagedConfiguration, ShowsEveryKeyThatIsRead) {
    const std::string file = packaged();

    for (const std::string& key : parsed(uncommented(true)).known) {
        EXPECT_TRUE(shows(file, key)) << key;
    }
}

} // namespace
} // namespace halyard::linux_
