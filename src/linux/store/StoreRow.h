// What waits to be written to the store.
//
// Rows hold shared values: the JSON text is made on the writer's thread, right
// before the INSERT, so whoever adds a row pays for a reference and no more.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <variant>

#include "common/Value.h"
#include "linux/store/Schema.h"
#include "platform/ClientBudget.h"
#include "platform/EventServices.h"
#include "platform/RelayReporting.h"

namespace halyard::linux_ {

// An upload session, shared by its rows and by whoever sends through it.
//
// Its own row is written before its first message, whenever that is: a session
// that was opened while nothing could be stored still gets its row later.
struct StoreUpload {
    std::int64_t sessionID = 0;
    Dictionary sessionInfo;
    Dictionary userInfo;
    double opened = 0;

    // Whether the store took a row of this session, so that it needs closing.
    std::atomic<bool> accepted{false};
    // The id of its row once there is one, and which opening of the file gave it.
    // Only the writer's thread.
    std::int64_t row = 0;
    std::uint64_t generation = 0;
};
using StoreUploadPtr = std::shared_ptr<StoreUpload>;

struct StoreOpenRow {
    StoreUploadPtr upload;
};
struct StoreCloseRow {
    StoreUploadPtr upload;
    platform::UploadEnding ending;
    double time;
};
struct StoreMessageRow {
    StoreUploadPtr upload;
    Dictionary payload;
    std::uint32_t type;
    std::uint16_t category;
    double time;
};
struct StoreSingleRow {
    Dictionary sessionInfo;
    Dictionary userInfo;
    Dictionary payload;
    std::uint32_t type;
    std::uint16_t category;
    double time;
};
struct StoreAnalyticsRow {
    using Builder = platform::AnalyticsService::PayloadBuilder;

    // Calls the builder, unless that has been done.
    void build();
    bool isBuilt() const { return std::holds_alternative<platform::EventPayload>(payload); }
    // Requires isBuilt().
    const platform::EventPayload& built() const {
        return std::get<platform::EventPayload>(payload);
    }

    Value name;
    std::variant<Builder, platform::EventPayload> payload;
    double time;
};
struct StoreEnergyRow {
    Value name;
    Dictionary payload;
    std::uint32_t client;
    double time;
};
struct StoreMetricRow {
    std::string message;
    std::uint32_t metricID;
    double time;
};
struct StoreIncidentRow {
    Dictionary signature;
    Value report;
    double time;
};
struct StoreRepeatRow {
    StoreUploadPtr upload;
    platform::Repeats repeats;
};

using StoreRow =
    std::variant<StoreOpenRow, StoreCloseRow, StoreMessageRow, StoreSingleRow, StoreAnalyticsRow,
                 StoreEnergyRow, StoreMetricRow, StoreIncidentRow, StoreRepeatRow>;

// A row on its way, with the memory it is charged with.
struct StoreItem {
    StoreRow row;
    std::size_t bytes = 0;
    platform::ClientBudgetPtr client{}; // whose it is; null: the daemon's own
    bool isAwaited = false;             // it counts for what its client has on its way
};

StoreTable tableOf(const StoreRow& row);

// About how much memory a row keeps alive, contents shared with others included.
std::size_t storeBytes(const StoreRow& row);
std::size_t storeBytes(const Dictionary& dictionary);
std::size_t storeBytes(const platform::EventPayload& payload);

} // namespace halyard::linux_
