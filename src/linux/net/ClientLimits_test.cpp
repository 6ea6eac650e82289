// What one process may have waiting in its connections. The tests' clients are all of
// one process: the test's.

#include <gmock/gmock.h>

#include "linux/net/ListenerFixture.h"

namespace halyard::linux_ {
namespace {

class ClientLimitsTest : public ListenerFixture {
protected:
    bool logged(std::string_view text) { return log_.countOf(text, LogLevel::Error) > 0; }
    // Most of a frame, whose end never comes.
    void sendUnfinished(int fd, std::size_t bytes) {
        const std::string frame = notification(bytes + 100);
        send(fd, frame.substr(0, frame.size() - 100));
    }
};

TEST_F(ClientLimitsTest, UnfinishedFramesBeyondTheMemoryCostTheirConnection) {
    listener_->setLimits({.memory = 1'000'000});
    const int first = connect();
    sendUnfinished(first, 300'000);
    EXPECT_EQ(receive(first), "");
    const int second = connect();
    (void)sendSome(second, notification(900'000).substr(0, 150'000));
    for (int i = 0; i < 10 && receive(second) != "closed"; ++i) {
        (void)sendSome(second, std::string(100'000, 'x'));
    }
    EXPECT_EQ(receive(second), "closed");
    EXPECT_TRUE(logged("limits.memory"));
    EXPECT_EQ(receive(first), "");
    leave(first);
    sendUnfinished(connect(), 300'000);
    EXPECT_EQ(listener_->counters().broken, 1U);
}

TEST_F(ClientLimitsTest, ConnectionsBeyondAreRefusedAndSaidOnce) {
    listener_->setLimits({.connections = 2});
    connect();
    const int second = connect();
    EXPECT_EQ(receive(connect()), "closed");
    EXPECT_EQ(receive(connect()), "closed");
    EXPECT_EQ(log_.countOf("limits.connections", LogLevel::Error), 1U);
    EXPECT_EQ(listener_->counters().refused, 2U);
    leave(second);
    EXPECT_EQ(receive(connect()), "");
}

TEST_F(ClientLimitsTest, AllConnectionsOfAProcessShareWhatMayBeUnprocessed) {
    delegate_.object->holdCharges = true;
    std::string frames;
    for (int i = 0; i < 1000; ++i) {
        frames += notification();
    }
    for (int i = 0; i < 6; ++i) {
        (void)sendSome(connect(), frames);
    }
    EXPECT_GE(delegate_.object->requests.size(), 4096U);
    EXPECT_LT(delegate_.object->requests.size(), 5000U);
    while (!delegate_.object->charges.empty()) {
        delegate_.object->charges.clear();
        settle();
    }
    EXPECT_EQ(delegate_.object->requests.size(), 6000U);
}

TEST_F(ClientLimitsTest, WhatIsSmallOnTheWireAndLargeInMemoryCountsAsLarge) {
    delegate_.object->holdCharges = true;
    protocol::Arguments arguments;
    arguments.dictionary.set("l", List(std::vector<Value>(30'000, List{Value(1)})));
    const std::string frame = call(protocol::Method::SendMessage, arguments, std::nullopt);
    ASSERT_LT(frame.size(), 70'000U);
    const int client = connect();
    for (int i = 0; i < 40; ++i) {
        (void)sendSome(client, frame);
    }
    EXPECT_LT(delegate_.object->requests.size(), 12U); // 32 MiB
}

} // namespace
} // namespace halyard::linux_
