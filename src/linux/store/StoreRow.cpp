#include "linux/store/StoreRow.h"

#include "common/ValueSize.h"

#include <array>

namespace halyard::linux_ {
namespace {

struct Bytes {
    std::size_t operator()(const StoreOpenRow& row) const {
        return storeBytes(row.upload->sessionInfo) + storeBytes(row.upload->userInfo);
    }
    std::size_t operator()(const StoreCloseRow&) const { return 0; }
    std::size_t operator()(const StoreMessageRow& row) const { return storeBytes(row.payload); }
    std::size_t operator()(const StoreSingleRow& row) const {
        return storeBytes(row.sessionInfo) + storeBytes(row.userInfo) + storeBytes(row.payload);
    }
    std::size_t operator()(const StoreAnalyticsRow& row) const {
        return row.isBuilt() ? storeBytes(row.built()) : 0;
    }
    std::size_t operator()(const StoreEnergyRow& row) const { return storeBytes(row.payload); }
    std::size_t operator()(const StoreMetricRow& row) const { return row.message.size(); }
    std::size_t operator()(const StoreIncidentRow& row) const {
        return storeBytes(row.signature) + bytesOf(row.report);
    }
    std::size_t operator()(const StoreRepeatRow&) const { return 0; }
};

} // namespace

std::size_t storeBytes(const Dictionary& dictionary) {
    return bytesOf(dictionary);
}

std::size_t storeBytes(const platform::EventPayload& payload) {
    const auto& [key, value] = payload.top;
    return bytesOf(payload.message) + bytesOf(key) + bytesOf(value);
}

void StoreAnalyticsRow::build() {
    if (auto* const builder = std::get_if<Builder>(&payload)) {
        // It holds the session, which may end with it.
        const Builder called = std::move(*builder);
        payload = called();
    }
}

StoreTable tableOf(const StoreRow& row) {
    using enum StoreTable;
    // In the order of StoreRow.
    constexpr std::array kTables = {UploadSession, UploadSession,  UploadMessage,
                                    UploadMessage, AnalyticsEvent, EnergyEvent,
                                    Metric,        Incident,       Repeat};
    static_assert(kTables.size() == std::variant_size_v<StoreRow>);
    return kTables[row.index()];
}

std::size_t storeBytes(const StoreRow& row) {
    return sizeof(StoreRow) + std::visit(Bytes{}, row);
}

} // namespace halyard::linux_
