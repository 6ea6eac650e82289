// Texts of configuration files as tests read them.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <string_view>
#include <vector>

#include "linux/config/Settings.h"

namespace halyard::linux_ {

inline ParsedSettings parsed(std::string_view text) {
    auto result = parseSettings(text, "/etc/halyard/halyard.toml");
    if (!result.ok()) {
        const SettingsFailure& failure = result.failure();
        ADD_FAILURE() << failure.line << ":" << failure.column << ": " << failure.text;
        return {};
    }
    return std::move(result).value();
}

inline Settings settings(std::string_view text) {
    ParsedSettings result = parsed(text);
    EXPECT_THAT(result.warnings, ::testing::ElementsAre());
    return result.settings;
}

// "LINE:COLUMN: MESSAGE", empty when the text is taken.
inline std::string mistake(std::string_view text) {
    const auto result = parseSettings(text, "f");
    if (result.ok()) {
        return "";
    }
    const SettingsFailure& failure = result.failure();
    return std::to_string(failure.line) + ":" + std::to_string(failure.column) + ": " +
           failure.text;
}

inline std::vector<SettingsWarning> warnings(std::string_view text) {
    return parsed(text).warnings;
}

} // namespace halyard::linux_
