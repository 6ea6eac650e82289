// The store and the four back ends that the platform offers over it.
//
// Made and offered on one thread; the pieces may be used from any.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "linux/store/Store.h"
#include "linux/store/StoreEventServices.h"
#include "linux/store/StoreRelayReporting.h"
#include "platform/Platform.h"

namespace halyard::linux_ {

struct StoreServices {
    // Borrows the clock and the randomness.
    StoreServices(StoreOptions options, const platform::Clock& clock, platform::Random& random)
        : store(std::move(options), clock), relayReporting(store, random), analytics(store),
          energyLedger(store), metrics(store) {}

    void offerTo(platform::Platform& platform) {
        platform.relayReporting = &relayReporting;
        platform.analytics = &analytics;
        platform.energyLedger = &energyLedger;
        platform.metrics = &metrics;
    }

    Store store;
    StoreRelayReporting relayReporting;
    StoreAnalyticsService analytics;
    StoreEnergyLedger energyLedger;
    StoreMetricService metrics;
};

} // namespace halyard::linux_
