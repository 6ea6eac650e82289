#include "linux/store/StoreShares.h"

#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

class StoreSharesTest : public StoreFixture {
protected:
    static constexpr std::uint64_t kMost = 4 * 1024 * 1024;

    StoreSharesTest() {
        options_.limits.maxBytes = kMost;
        open();
    }

    static Dictionary row(std::size_t bytes) { return {{"text", std::string(bytes, 'x')}}; }
    void add(const StoreUploadPtr& upload, int count, std::size_t bytes) {
        for (int i = 0; i < count; ++i) {
            EXPECT_TRUE(store_->addMessage(upload, 1, 1, row(bytes)));
        }
        flush();
    }
    std::int64_t bytesOf(const StoreUploadPtr& upload) {
        return reader().number("SELECT sum(length(payload)) FROM upload_message "
                               "WHERE upload_session = " +
                               std::to_string(upload->row));
    }
    std::int64_t rowsOf(const StoreUploadPtr& upload) {
        return reader().number("SELECT count(*) FROM upload_message WHERE upload_session = " +
                               std::to_string(upload->row));
    }
    // The writer comes back by itself for what is too much; a row makes it sure.
    void settle() {
        for (int i = 0; i < 2; ++i) {
            store_->addMetric(0, "tick");
            flush();
        }
    }
};

TEST_F(StoreSharesTest, ASessionKeepsItsShareAndPushesOutNobodyElse) {
    const auto other = store_->openUpload(1, {}, {});
    add(other, 100, 1000);
    const auto large = store_->openUpload(2, {}, {});
    for (int i = 0; i < 50; ++i) {
        add(large, 1, 200'000);
    }
    settle();
    EXPECT_EQ(rowsOf(other), 100);
    EXPECT_LE(bytesOf(large), static_cast<std::int64_t>(kMost / StoreShares::kHolderShare));
    EXPECT_GE(rowsOf(large), 4);
    EXPECT_EQ(reader().number("SELECT max(id) FROM upload_message"), 150) << "its newest stay";
    EXPECT_EQ(store_->status().removed[static_cast<std::size_t>(StoreTable::UploadMessage)],
              static_cast<std::uint64_t>(150 - 100 - rowsOf(large)));
}

TEST_F(StoreSharesTest, ManySmallRowsOfASessionHaveTheSameShare) {
    const auto other = store_->openUpload(1, {}, {});
    const auto busy = store_->openUpload(2, {}, {});
    for (int i = 0; i < 30; ++i) {
        add(busy, 300, 400);
        add(other, 1, 400); // In the midst of them.
    }
    settle();
    EXPECT_EQ(rowsOf(other), 30);
    EXPECT_LE(bytesOf(busy), static_cast<std::int64_t>(kMost / StoreShares::kHolderShare));
    EXPECT_GE(bytesOf(busy), static_cast<std::int64_t>(kMost / StoreShares::kHolderShare * 3 / 4));
}

TEST_F(StoreSharesTest, LargeEventsOfAClientHaveAShareOfTheirOwn) {
    const auto limits = std::make_shared<platform::SharedLimits>();
    const auto one = std::make_shared<platform::ClientBudget>(limits);
    const auto two = std::make_shared<platform::ClientBudget>(limits);
    const auto addEvents = [&](const platform::ClientBudgetPtr& client, int count) {
        const platform::BudgetScope scope(client);
        for (int i = 0; i < count; ++i) {
            store_->addEnergyEvent(1, client == one ? "one" : "two", row(100'000));
            flush();
        }
    };
    addEvents(one, 5);
    addEvents(two, 100);
    settle();
    EXPECT_EQ(reader().number("SELECT count(*) FROM energy_event WHERE name = 'one'"), 5);
    EXPECT_LE(reader().number("SELECT count(*) FROM energy_event WHERE name = 'two'"), 10);
}

TEST_F(StoreSharesTest, ARowAboveItsShareIsRejectedAndCounted) {
    const auto upload = store_->openUpload(1, {}, {});
    const std::size_t most = kMost / StoreShares::kRowShare;
    add(upload, 1, most);
    add(upload, 1, most - 100);
    EXPECT_EQ(rowsOf(upload), 1);
    const StoreLosses lost =
        store_->status().lost[static_cast<std::size_t>(StoreTable::UploadMessage)];
    EXPECT_EQ(lost[static_cast<std::size_t>(StoreLoss::Rejected)], 1U);
}

} // namespace
} // namespace halyard::linux_
