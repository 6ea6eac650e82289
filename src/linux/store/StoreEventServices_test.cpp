#include "linux/store/StoreEventServices.h"

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

class StoreEventServicesTest : public StoreFixture {};

TEST_F(StoreEventServicesTest, WantsTheDaemonsOwnEventsByDefault) {
    StoreAnalyticsService service(open());
    EXPECT_TRUE(service.isEventUsed("com.kestrel.halyard.Volume.Summary"));
    EXPECT_FALSE(service.isEventUsed("com.kestrel.alarms.Volume.Summary"));
    EXPECT_FALSE(service.isEventUsed(""));
}

TEST_F(StoreEventServicesTest, PatternsCanBeReplaced) {
    StoreAnalyticsService service(open(), {"a.?.[xy]"});
    EXPECT_TRUE(service.isEventUsed("a.b.x"));
    EXPECT_FALSE(service.isEventUsed("a.b.z"));
    service.setWanted({"*.z", "other"});
    EXPECT_FALSE(service.isEventUsed("a.b.x"));
    EXPECT_TRUE(service.isEventUsed("a.b.z"));
    service.setWanted({});
    EXPECT_FALSE(service.isEventUsed("a.b.z"));
}

TEST_F(StoreEventServicesTest, RemembersABoundedNumberOfNames) {
    StoreAnalyticsService service(open());
    for (std::size_t i = 0; i < 2 * StoreAnalyticsService::kMaxKnownNames; ++i) {
        EXPECT_TRUE(service.isEventUsed("com.kestrel.halyard." + std::to_string(i)));
    }
    EXPECT_TRUE(service.isEventUsed("com.kestrel.halyard.0"));
}

TEST_F(StoreEventServicesTest, BuildsPayloadsOnTheStoresThread) {
    StoreAnalyticsService service(open());
    std::thread::id builder;
    service.sendEventLazily("com.kestrel.halyard.A.B", [&builder] {
        builder = std::this_thread::get_id();
        return examplePayload();
    });
    flush();
    EXPECT_NE(builder, std::this_thread::get_id());
    EXPECT_EQ(reader().one("SELECT name, payload ->> 'audiotag' FROM analytics_event"),
              "com.kestrel.halyard.A.B|Playback_Start");
}

TEST_F(StoreEventServicesTest, BuildsPayloadsAtOnceWhileRowsPileUp) {
    options_.marks.highRows = 1;
    StoreAnalyticsService service(open());
    addSingles(1, {});
    bool built = false;
    service.sendEventLazily("name", [&built] {
        built = true;
        return Dictionary();
    });
    EXPECT_TRUE(built);
    flush();
}

TEST_F(StoreEventServicesTest, AnEventWeighsLikeItsOwnClientsLargestUntilItIsBuilt) {
    StoreAnalyticsService service(open());
    const auto limits = std::make_shared<const platform::SharedLimits>();
    const auto large = std::make_shared<platform::ClientBudget>(limits);
    const auto small = std::make_shared<platform::ClientBudget>(limits);
    const auto send = [&service](const platform::ClientBudgetPtr& client, std::size_t bytes) {
        const platform::BudgetScope scope(client);
        service.sendEventLazily("name", [bytes] {
            return Dictionary{{"text", std::string(bytes, 'x')}};
        });
    };
    send(large, 1'000'000);
    flush();
    send(small, 1);
    EXPECT_LT(store_->status().queuedBytes, 10'000U);
    send(large, 1);
    EXPECT_GT(store_->status().queuedBytes, 1'000'000U);
}

TEST_F(StoreEventServicesTest, NobodyWantsEventsWithoutAStore) {
    options_.path = directory_.path() / "absent" / "telemetry.db";
    StoreAnalyticsService service(open());
    EXPECT_FALSE(service.isEventUsed("com.kestrel.halyard.Volume.Summary"));
}

TEST_F(StoreEventServicesTest, LedgerAndMetricsReachTheirTables) {
    open();
    StoreEnergyLedger ledger(*store_);
    StoreMetricService metrics(*store_);
    ledger.registerEvent(28, "LeakedHapticsSessionInfo", {{"Active_Clients", 2}});
    metrics.postMetric(0x5B0003, "\x08\x01");
    flush();
    EXPECT_EQ(reader().one("SELECT client, name, payload FROM energy_event"),
              "28|LeakedHapticsSessionInfo|{\"Active_Clients\":2}");
    EXPECT_EQ(reader().one("SELECT metric_id, hex(message) FROM metric"), "5963779|0801");
}

} // namespace
} // namespace halyard::linux_
