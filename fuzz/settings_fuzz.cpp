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

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto result =
        halyard::linux_::parseSettings({reinterpret_cast<const char*>(data), size}, "fuzz");
    if (result.ok()) {
        check(result.value());
    } else {
        require(!result.failure().text.empty() && result.failure().file == "fuzz");
    }
    return 0;
}
