// The configuration file is an operator's, but no text may do more than be
// refused.

#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "Require.h"
#include "linux/config/Quantities.h"
#include "linux/config/Settings.h"

using halyard::fuzz::require;
using halyard::linux_::ParsedSettings;

namespace {

void check(const ParsedSettings& parsed) {
    using namespace halyard::linux_;
    require(parsed.settings.store.maxBytes >= decltype(Settings::store)::kLeastBytes);
    require(parsed.settings.store.maxAge.count() >= 1);
    require(parsed.settings.store.maxAge <= kMaxDuration);
    require(parsed.warnings.size() <= kMaxSettingsWarnings);
    require(parsed.settings.driverChannels.size() <= kMaxDriverChannels);
    for (const DriverChannel& channel : parsed.settings.driverChannels) {
        require(channel.group || channel.subgroup);
        require(!channel.name.empty() && channel.source.find(':') != std::string::npos);
    }
}

// A file that is read over what it left changes nothing, but for the channels that it adds.
void checkOverItself(std::string_view text, const halyard::linux_::Settings& settings) {
    using namespace halyard::linux_;
    auto again = parseSettings(text, "fuzz", settings);
    require(again.ok() || settings.driverChannels.size() * 2 > kMaxDriverChannels);
    if (again.ok()) {
        again.value().settings.driverChannels = settings.driverChannels;
        require(again.value().settings.store == settings.store);
        require(again.value().settings.exporting == settings.exporting);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace halyard::linux_;
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    const auto result = parseSettings(text, "fuzz");
    if (result.ok()) {
        check(result.value());
        checkOverItself(text, result.value().settings);
    } else {
        require(!result.failure().text.empty() && result.failure().file == "fuzz");
    }
    return 0;
}
