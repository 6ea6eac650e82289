#include "client/SessionTable.h"

#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "client/DictionaryWriter.h"
#include "protocol/Wire.h"

namespace halyard::client {
namespace {

using protocol::Method;

class SessionTableTest : public testing::Test {
protected:
    bool apply(Method method, std::int64_t reporterID, std::uint16_t type = 0) {
        Record record{.method = method};
        record.reporterID = reporterID;
        record.type = type;
        return table_.apply(record);
    }
    void configure(std::int64_t reporterID, const char* key, const char* value) {
        DictionaryWriter writer(0);
        writer.setText(key, value);
        Record record{.method = Method::SetConfiguration};
        record.reporterID = reporterID;
        record.entryCount = writer.entryCount();
        record.bodyBytes = static_cast<std::uint32_t>(writer.body().size());
        std::vector<std::uint64_t> memory(64);
        std::memcpy(memory.data(), &record, sizeof(record));
        std::memcpy(reinterpret_cast<char*>(memory.data()) + sizeof(record), writer.body().data(),
                    writer.body().size());
        table_.apply(*reinterpret_cast<const Record*>(memory.data()));
    }
    const SessionTable::Session& only() { return table_.sessions().begin()->second; }

    SessionTable table_;
};

TEST_F(SessionTableTest, AStartIsHeldOnlyWhenItStartsSomething) {
    EXPECT_FALSE(apply(Method::StartReportingSessionForID, 7));
    apply(Method::CreateReportingSession, 7);
    EXPECT_TRUE(apply(Method::StartReportingSessionForID, 7));
    EXPECT_FALSE(apply(Method::StartReportingSessionForID, 7));
    apply(Method::StopReportingSessionForID, 7);
    EXPECT_TRUE(apply(Method::StartReportingSessionForID, 7));
}

TEST_F(SessionTableTest, KeepsTheOrderOfCreation) {
    for (const std::int64_t id : {9, 3, 5}) {
        apply(Method::CreateReportingSession, id);
    }
    apply(Method::DestroyReportingSession, 3);
    std::vector<std::int64_t> ids;
    for (const auto& [order, session] : table_.sessions()) {
        ids.push_back(session.reporterID);
    }
    EXPECT_EQ(ids, (std::vector<std::int64_t>{9, 5}));
}

TEST_F(SessionTableTest, CreatingAnIdAgainReplacesItsSession) {
    apply(Method::CreateReportingSession, 7);
    apply(Method::SetServiceType, 7, 3);
    apply(Method::CreateReportingSession, 7);
    ASSERT_EQ(table_.sessions().size(), 1U);
    EXPECT_FALSE(only().serviceType.has_value());
}

TEST_F(SessionTableTest, MergesConfigurations) {
    apply(Method::CreateReportingSession, 7);
    configure(7, "room", "kitchen");
    configure(7, "room", "hall");
    configure(7, "volume", "low");
    EXPECT_EQ(only().configuration, (Dictionary{{"room", "hall"}, {"volume", "low"}}));
}

// Else the order of two updates would be lost in the merged one.
TEST_F(SessionTableTest, TheAliasOfTheApplicationSetsItToo) {
    apply(Method::CreateReportingSession, 7);
    configure(7, "HostApplicationDisplayID", "first");
    configure(7, "VQHostApplicationDisplayID", "second");
    EXPECT_EQ(only().configuration["HostApplicationDisplayID"].text(), "second");
}

} // namespace
} // namespace halyard::client
