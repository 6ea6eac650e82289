#include "service/FeatureState.h"

#include <cmath>

#include "platform/Clock.h"
#include "platform/Device.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace halyard {
namespace {

constexpr const char* kHalyardDomain = "com.kestrel.halyard";
constexpr const char* kDeviceName = "device_name";
constexpr const char* kDisableReporting = "disable_reporting";

std::int32_t roundedUptimeSeconds() {
    const std::chrono::duration<double> uptime = platform::current().clock->systemUptime();
    return static_cast<std::int32_t>(std::lround(uptime.count()));
}

} // namespace

std::vector<FeatureRecord> makeFeatureRecords() {
    return {{"com.kestrel.pinwheel", "spatial-audio-accessory-feature",
             "com.kestrel.pinwheel.spatial-audio-accessory-feature.changed", std::nullopt},
            {kHalyardDomain, kDeviceName, "com.kestrel.halyard.reporting", std::nullopt}};
}

Dictionary HYReportingDefaults() {
    const platform::Preferences& preferences = *platform::current().preferences;
    Dictionary defaults;
    // As in the feature state: what is set goes in, whatever it is, and only what
    // is not set stays out.
    defaults.set(kDeviceName, preferences.value(kDeviceName, kHalyardDomain));
    defaults.set(kDisableReporting,
                 preferences.value(kDisableReporting, kHalyardDomain).boolValue());
    return defaults;
}

std::optional<Dictionary> readFeaturesState(const std::vector<FeatureRecord>& features) {
    HY_LOG_DEFAULT(HYReportingServiceDelegateCategory, "getting features");
    Dictionary state;
    for (const FeatureRecord& feature : features) {
        state.set(Value(feature.featureDomain), platform::current().preferences->value(
                                                    feature.featureDomain, feature.defaultsDomain));
    }
    if (state.empty()) {
        return std::nullopt;
    }
    state.set("hyreporting_timestamp",
              platform::secondsSince1970(platform::current().clock->wallTime()));
    state.set("systemuptime_sec", roundedUptimeSeconds());
    return state;
}

Value describeFeatures(const std::vector<FeatureRecord>& features) {
    List records;
    for (const FeatureRecord& feature : features) {
        Dictionary record{{"defaults_domain", feature.defaultsDomain},
                          {"feature_domain", feature.featureDomain},
                          {"notification", feature.notification}};
        if (feature.notifyToken) {
            record.set("notify_token", *feature.notifyToken);
        }
        records.append(record);
    }
    return records;
}

} // namespace halyard
