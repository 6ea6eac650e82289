#include "linux/net/SocketConnection.h"

#include <sys/socket.h>

#include "linux/net/ListenerFixture.h"
#include "linux/queues/PooledSerialQueue.h"

namespace halyard::linux_ {
namespace {

using protocol::Method;

class SocketConnectionTest : public ListenerFixture {};

// Whether the thread that read a request is lent for the work of it.
class LoanRecorder final : public platform::ExportedObject {
public:
    void handle(protocol::Request) override { lent.push_back(WakeUpScope::lendsThread()); }

    std::vector<bool> lent;
};

class SocketConnectionLoanTest : public ListenerFixture, public platform::ListenerDelegate {
protected:
    SocketConnectionLoanTest() { listener_->setDelegate(this); }
    bool shouldAcceptNewConnection(const std::shared_ptr<platform::Connection>& made) override {
        made->setExportedObject(recorder_);
        made->resume();
        return true;
    }

    const std::shared_ptr<LoanRecorder> recorder_ = std::make_shared<LoanRecorder>();
};

TEST_F(SocketConnectionLoanTest, AFewMessagesAreDoneWhereTheyWereRead) {
    send(connect(), notification() + notification());
    EXPECT_EQ(recorder_->lent, (std::vector<bool>{true, true}));
}

TEST_F(SocketConnectionLoanTest, WhatAnAdministratorAsksForIsNotDoneWhereItWasRead) {
    const int client = connect();
    send(client, call(Method::AdminFlush) + notification());
    send(client, call(Method::KillService));
    EXPECT_EQ(recorder_->lent, std::vector<bool>(3, false));
}

TEST_F(SocketConnectionLoanTest, ManyMessagesAreLeftToSeveralThreads) {
    send(connect(), notification(20'000) + notification());
    EXPECT_EQ(recorder_->lent, std::vector<bool>(2, false));
}

TEST_F(SocketConnectionTest, ABrokenConnectionIsInterruptedThenInvalidated) {
    const int client = connect();
    const int other = connect();
    send(client, "\xc1");

    EXPECT_EQ(receive(client), "closed");
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
    EXPECT_EQ(receive(other), "") << "nobody else notices";
}

TEST_F(SocketConnectionTest, AClientThatLeavesIsInvalidatedOnly) {
    const int client = connect();
    ::shutdown(client, SHUT_RDWR);
    settle();

    EXPECT_EQ(delegate_.events, std::vector<std::string>{"invalidated"});
}

TEST_F(SocketConnectionTest, WhatWasSentBeforeLeavingIsStillTaken) {
    const int client = connect();
    ASSERT_EQ(::send(client, notification().data(), notification().size(), 0),
              static_cast<ssize_t>(notification().size()));
    ::shutdown(client, SHUT_WR);
    settle();

    EXPECT_EQ(delegate_.object->requests.size(), 1u);
    EXPECT_EQ(delegate_.events, std::vector<std::string>{"invalidated"});
}

TEST_F(SocketConnectionTest, StopsReadingWhileTooManyRequestsAreUnprocessed) {
    delegate_.object->holdCharges = true;
    const int client = connect();
    std::string many;
    for (std::size_t i = 0; i < 2 * SocketConnection::kMaxUnprocessedRequests; ++i) {
        many += notification();
    }
    ASSERT_EQ(sendSome(client, many), many.size());
    EXPECT_EQ(delegate_.object->requests.size(), SocketConnection::kMaxUnprocessedRequests);

    delegate_.object->charges.clear();
    settle();
    EXPECT_EQ(delegate_.object->requests.size(), 2 * SocketConnection::kMaxUnprocessedRequests);
}

TEST_F(SocketConnectionTest, StopsReadingWhileTooManyBytesAreUnprocessed) {
    delegate_.object->holdCharges = true;
    const int client = connect();
    const std::string large = notification(900'000);
    std::size_t sent = 0;
    for (std::size_t got = 1; got > 0; sent += got) {
        got = sendSome(client, std::string_view(large).substr(sent % large.size()));
    }
    EXPECT_GE(sent, SocketConnection::kMaxUnprocessedBytes);
    EXPECT_LT(sent, SocketConnection::kMaxUnprocessedBytes + 4 * large.size());
    const std::size_t before = delegate_.object->requests.size();

    delegate_.object->charges.clear();
    settle();
    send(client, std::string_view(large).substr(sent % large.size()));
    EXPECT_GT(delegate_.object->requests.size(), before);
}

// The work of these is done when they are handed over, so the connection may
// read again by the time that it looks why it stopped.
TEST_F(SocketConnectionTest, ABurstThatPassesABoundForAMomentIsTakenWhole) {
    constexpr std::size_t kBurst = 2 * SocketConnection::kMaxUnprocessedRequests + 500;
    const int client = connect();
    std::string burst;
    for (std::size_t i = 0; i < kBurst; ++i) {
        burst += call(Method::GetAllReporters, {}, std::nullopt);
    }
    ASSERT_LT(burst.size(), ListenerShared::kReadSize) << "is to come in one read";
    ASSERT_EQ(sendSome(client, burst), burst.size());

    EXPECT_EQ(delegate_.object->requests.size(), kBurst);
}

TEST_F(SocketConnectionTest, NobodyIsReadFromUnderPressure) {
    const int client = connect();
    pressure_.set(Pressure::Store, true);
    ASSERT_GT(sendSome(client, notification()), 0u);
    EXPECT_TRUE(delegate_.object->requests.empty());

    pressure_.set(Pressure::Store, false);
    settle();
    EXPECT_EQ(delegate_.object->requests.size(), 1u);
}

TEST_F(SocketConnectionTest, APeerThatLeavesItsAnswersLyingIsClosed) {
    const int client = connect();
    send(client, call(Method::GetAllReporters) + call(Method::GetAllReporters));
    auto& requests = delegate_.object->requests;
    requests[0].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes / 2, 'x'));
    settle();
    ASSERT_GT(sendSome(client, notification()), 0u);
    EXPECT_EQ(requests.size(), 2u) << "it is not read from meanwhile";
    EXPECT_TRUE(delegate_.events.empty());

    requests[1].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes, 'x'));
    settle();
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
}

TEST_F(SocketConnectionTest, ReadsOnOnceTheAnswersAreTaken) {
    const int client = connect();
    send(client, call(Method::GetAllReporters));
    delegate_.object->requests[0].reply(std::nullopt, std::string(1'000'000, 'x'));
    settle();
    ASSERT_GT(sendSome(client, notification()), 0u);
    while (!receive(client).empty()) {
        settle();
    }
    EXPECT_EQ(delegate_.object->requests.size(), 2u);
}

// What a peer writes before it goes away with its answers unread.
class LeavingPeerTest : public SocketConnectionTest {
protected:
    static constexpr std::size_t kWritten = 2500;

    // Answers what has been handed over so far.
    void answerAll() {
        for (const protocol::Request& request : delegate_.object->requests) {
            request.reply(std::nullopt, true);
        }
        settle();
    }
    // Writes requests, of which as many are taken as may be unprocessed.
    int connectAndWrite() {
        delegate_.object->holdCharges = true;
        const int client = connect();
        std::string many;
        for (std::size_t i = 0; i < kWritten; ++i) {
            many += call(Method::GetAllReporters);
        }
        EXPECT_EQ(sendSome(client, many), many.size());
        EXPECT_EQ(delegate_.object->requests.size(), SocketConnection::kMaxUnprocessedRequests);
        return client;
    }
    void letGoOfCharges() {
        while (!delegate_.object->charges.empty()) {
            delegate_.object->charges.clear();
            settle();
        }
    }
};

TEST_F(LeavingPeerTest, AllThatItWroteIsTakenThoughItsAnswersCannotBeWritten) {
    ::shutdown(connectAndWrite(), SHUT_RDWR);
    answerAll();
    EXPECT_TRUE(delegate_.events.empty()) << "it has not been heard to the end";

    letGoOfCharges();
    EXPECT_EQ(delegate_.object->requests.size(), kWritten);
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
}

TEST_F(LeavingPeerTest, AllThatItWroteIsTakenThoughItLeftItsAnswersUnread) {
    const int client = connectAndWrite();
    answerAll();
    leave(client);

    letGoOfCharges();
    EXPECT_EQ(delegate_.object->requests.size(), kWritten);
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
}

TEST_F(LeavingPeerTest, AnswersThatItLeftLyingCountForNothingOnceItIsGone) {
    const int client = connectAndWrite();
    const auto& requests = delegate_.object->requests;
    requests[0].reply(std::nullopt, std::string(1'000'000, 'x'));
    settle();
    ::shutdown(client, SHUT_RDWR);
    requests[1].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes, 'x'));

    letGoOfCharges();
    EXPECT_EQ(requests.size(), kWritten);
}

TEST_F(LeavingPeerTest, OneThatOnlyTakesNoAnswersIsHeardUntilItLeaves) {
    const int client = connect();
    send(client, call(Method::GetAllReporters));
    ::shutdown(client, SHUT_RD);
    answerAll();
    send(client, notification());
    EXPECT_EQ(delegate_.object->requests.size(), 2u);
    EXPECT_TRUE(delegate_.events.empty());

    ::shutdown(client, SHUT_WR);
    settle();
    EXPECT_EQ(delegate_.events, (std::vector<std::string>{"interrupted", "invalidated"}));
}

// The daemon's end.
class FinishingTest : public LeavingPeerTest {
protected:
    void finish() {
        listener_->finishReading([this] { finished_ = true; });
        settle();
    }
    bool finished_ = false;
};

TEST_F(FinishingTest, TakesWhatWasWrittenAndNothingLater) {
    const int client = connectAndWrite();
    finish();
    EXPECT_EQ(sendSome(client, notification()), 0u);
    EXPECT_FALSE(finished_);
    EXPECT_GT(listener_->unreadBytes(), 0u);

    letGoOfCharges();
    EXPECT_EQ(delegate_.object->requests.size(), kWritten);
    EXPECT_TRUE(finished_);
    EXPECT_EQ(delegate_.events, std::vector<std::string>{"invalidated"});
}

TEST_F(FinishingTest, AnswersThatNobodyTakesHoldNothingUp) {
    connectAndWrite();
    const auto& requests = delegate_.object->requests;
    requests[0].reply(std::nullopt, std::string(1'000'000, 'x'));
    settle();
    finish();
    requests[1].reply(std::nullopt, std::string(SocketConnection::kMaxUnsentBytes, 'x'));

    letGoOfCharges();
    EXPECT_EQ(requests.size(), kWritten);
    EXPECT_TRUE(finished_);
}

TEST_F(FinishingTest, IsDoneAtOnceWhereNobodyIsConnected) {
    finish();
    EXPECT_TRUE(finished_);
}

TEST_F(FinishingTest, WhoHasComeAndWrittenIsHeardAndWhoComesLaterIsRefused) {
    const int early = connectUnserved();
    const std::string written = notification();
    ASSERT_EQ(::send(early, written.data(), written.size(), 0), std::ssize(written));
    listener_->acceptTheLast();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path_.copy(address.sun_path, sizeof address.sun_path - 1);
    const int late = ::socket(AF_UNIX, SOCK_STREAM, 0);
    EXPECT_NE(::connect(late, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ::close(late);

    finish();
    EXPECT_EQ(delegate_.object->requests.size(), 1u);
    EXPECT_TRUE(finished_);
}

} // namespace
} // namespace halyard::linux_
