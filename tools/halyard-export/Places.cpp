#include "Places.h"

namespace halyard::exporting {
namespace {

namespace fs = std::filesystem;
using linux_::Directories;
using linux_::Environment;

// The variables that a service manager sets are the exporter's own.
Environment withoutManager(const Environment& environment) {
    return [&environment](std::string_view name) {
        return name == "STATE_DIRECTORY" ? std::nullopt : environment(name);
    };
}

} // namespace

Result<Places> placesOf(const std::optional<std::string>& state, const Environment& environment,
                        std::uint32_t uid, const fs::path& system) {
    std::error_code none;
    const bool isSystem = uid == 0 || fs::is_directory(system, none);
    const std::uint32_t as = isSystem ? 0 : uid;
    const auto configuration =
        linux_::resolveDirectory(&Directories::configuration, environment, as);
    if (!configuration.ok()) {
        return configuration.failure();
    }
    Places places{isSystem ? system : fs::path(), configuration.value(), {}};
    if (state) {
        places.store = *state;
    } else if (!isSystem) {
        const auto store =
            linux_::resolveDirectory(&Directories::state, withoutManager(environment), as);
        if (!store.ok()) {
            return store.failure();
        }
        places.store = store.value();
    }
    const auto own = environment("STATE_DIRECTORY");
    if (own && !own->empty()) {
        places.own = *own;
        return places;
    }
    const auto beside =
        linux_::resolveDirectory(&Directories::state, withoutManager(environment), uid);
    if (!beside.ok()) {
        return beside.failure();
    }
    places.own = uid == 0 ? fs::path("/var/lib/halyard-export")
                          : beside.value().parent_path() / "halyard-export";
    return places;
}

} // namespace halyard::exporting
