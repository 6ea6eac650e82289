#include "Plans.h"

#include <iterator>

#include "linux/drivers/BuiltInChannels.h"

namespace halyard::exporting {
namespace {

constexpr const char* kNobody = "http://nobody.invalid";

DriverNames driverNames(const linux_::Settings& settings) {
    auto channels = settings.driverChannels;
    auto builtIn = linux_::builtInChannels(linux_::SourceRoot());
    channels.insert(channels.end(), std::make_move_iterator(builtIn.begin()),
                    std::make_move_iterator(builtIn.end()));
    return DriverNames(channels);
}

Exporter::Plan planOf(const linux_::Settings& settings) {
    Exporter::Plan plan;
    plan.drivers = driverNames(settings);
    const auto own = settings.preferences.find(kLogSubsystem);
    if (own != settings.preferences.end() && own->second["device_name"].isString()) {
        plan.deviceName = own->second["device_name"].text();
    }
    return plan;
}

} // namespace

Exporter::Plan planFor(const linux_::Settings& settings, const linux_::Environment& environment,
                       std::string& trouble) {
    Exporter::Plan plan = planOf(settings);
    auto options = optionsFrom(settings.exporting, environment);
    if (options.ok()) {
        plan.options = std::move(options.value());
    } else {
        trouble = options.failure().message();
    }
    return plan;
}

reading::Outcome<Exporter::Plan> planToShow(const linux_::Settings& settings,
                                            const linux_::Environment& environment) {
    linux_::ExportSettings shown = settings.exporting;
    shown.endpoint = shown.endpoint.empty() ? kNobody : shown.endpoint;
    shown.headersFile.clear();
    shown.clientKey.clear();
    auto options = optionsFrom(shown, environment);
    if (!options.ok()) {
        return options.failure();
    }
    Exporter::Plan plan = planOf(settings);
    plan.options = std::move(options.value());
    plan.ignoresConsent = !plan.options.consent;
    plan.options.consent = true;
    plan.options.compress = false;
    plan.options.maxBytesPerDay = INT64_MAX;
    return plan;
}

} // namespace halyard::exporting
