// The library through its C++ face, against a daemon on a real socket.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <cstdlib>
#include <filesystem>
#include <mutex>
#include <thread>

#include "client/Client.h"
#include "halyard/halyard.hpp"
#include "testing/FakeDaemon.h"
#include "testing/TempTree.h"

namespace halyard::client {
namespace {

using halyard::testing::FakeDaemon;
using halyard::testing::TempTree;
using protocol::Call;
using protocol::Method;
using Calls = FakeDaemon::Calls;
using ::testing::ElementsAre;

// Values that callbacks leave, for the test to wait for.
template <class T> class Mailbox {
public:
    void put(T value) {
        const std::lock_guard lock(mutex_);
        values_.push_back(std::move(value));
        changed_.notify_all();
    }
    // The first one, which is removed.
    T take() {
        std::unique_lock lock(mutex_);
        const bool some =
            changed_.wait_for(lock, std::chrono::seconds(60), [&] { return !values_.empty(); });
        if (!some) {
            ADD_FAILURE() << "nothing came";
            return T();
        }
        T value = std::move(values_.front());
        values_.erase(values_.begin());
        return value;
    }
    bool empty() {
        const std::lock_guard lock(mutex_);
        return values_.empty();
    }

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<T> values_;
};

std::vector<Method> methodsOf(const Calls& calls) {
    std::vector<Method> methods;
    for (const Call& call : calls) {
        methods.push_back(call.method.value());
    }
    return methods;
}

std::int64_t codeOf(const reporting::Failure* failure) {
    return failure ? failure->code : 0;
}

class ClientTest : public ::testing::Test {
protected:
    ClientTest() { daemon_ = std::make_unique<FakeDaemon>(socket_); }
    ~ClientTest() override {
        client_.reset();
        daemon_.reset();
    }

    void connect(std::size_t memoryLimit = 0) {
        reporting::Client::Options options;
        options.socketPath = socket_.c_str();
        options.memoryLimit = memoryLimit;
        options.retryFirstMs = 1;
        options.retryLastMs = 2;
        options.flushTimeoutMs = flushTimeoutMs_;
        options.connectionChanged = [this](bool connected) { states_.put(connected); };
        client_ = std::make_unique<reporting::Client>(std::move(options));
    }
    void startAndConnect() {
        daemon_->start();
        connect();
        ASSERT_TRUE(states_.take());
    }
    // After it, nothing can be on its way into a connection that is gone.
    void stopDaemon() {
        daemon_->stop();
        ASSERT_FALSE(states_.take());
    }
    // The same after a reconnect.
    void stopDaemonAgain() {
        ASSERT_TRUE(states_.take());
        stopDaemon();
    }
    static reporting::Dictionary numbered(int number) {
        reporting::Dictionary message;
        message.set("n", number);
        return message;
    }
    reporting::Result sendNumber(reporting::Session& session, int number) {
        return session.send(numbered(number), HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START);
    }
    reporting::Done into(Mailbox<std::int64_t>& box) {
        return [&box](const reporting::Failure* failure) { box.put(codeOf(failure)); };
    }

    TempTree directory_;
    std::string socket_ = directory_ / "reporting.sock";
    std::uint32_t flushTimeoutMs_ = 60'000;
    std::unique_ptr<FakeDaemon> daemon_;
    // Outlive the client, whose callbacks write to them.
    Mailbox<bool> states_;
    Mailbox<std::int64_t> started_;
    Mailbox<std::int64_t> stopped_;
    std::unique_ptr<reporting::Client> client_;
};

TEST_F(ClientTest, SendsWhatASessionDoesInItsOrder) {
    startAndConnect();
    {
        reporting::Session session = client_->createSession(42);
        session.setServiceType(HALYARD_SERVICE_HAPTICS);
        session.setConfiguration(reporting::Dictionary().set("a", "b"));
        session.start();
        sendNumber(session, 1);
    }
    ASSERT_TRUE(daemon_->waitForCalls(7));
    const Calls calls = daemon_->calls();
    EXPECT_THAT(methodsOf(calls),
                ElementsAre(Method::CreateReportingSession, Method::SetServiceType,
                            Method::SetConfiguration, Method::StartReportingSessionForID,
                            Method::SendMessage, Method::StopReportingSessionForID,
                            Method::DestroyReportingSession));
    EXPECT_EQ(calls[0].arguments.reporterID, 42);
    EXPECT_EQ(calls[1].arguments.serviceType, HALYARD_SERVICE_HAPTICS);
    EXPECT_EQ(calls[2].arguments.dictionary, (Dictionary{{"a", "b"}}));
    EXPECT_EQ(calls[4].arguments.category, 4U);
    EXPECT_EQ(calls[4].arguments.type, 1);
    EXPECT_EQ(calls[4].arguments.reporterIDs, protocol::ReporterIDs{42});
    for (const Call& call : calls) {
        EXPECT_FALSE(call.messageID.has_value()); // Nobody asked for an answer.
    }
}

TEST_F(ClientTest, KeepsTheOrderOfManyMessages) {
    constexpr int kCount = 3000;
    startAndConnect();
    reporting::Session session = client_->createSession(1);
    for (int i = 0; i < kCount; ++i) {
        ASSERT_EQ(sendNumber(session, i), HALYARD_OK);
    }
    ASSERT_TRUE(daemon_->waitForCalls(kCount + 1));
    const Calls calls = daemon_->calls();
    for (int i = 0; i < kCount; ++i) {
        ASSERT_EQ(calls[static_cast<std::size_t>(i) + 1].arguments.dictionary["n"].integerValue(),
                  i);
    }
    EXPECT_EQ(client_->flush(60'000), HALYARD_OK);
    EXPECT_EQ(client_->statistics().sent, static_cast<std::uint64_t>(kCount));
    EXPECT_EQ(client_->statistics().queued_bytes, 0U);
}

TEST_F(ClientTest, GivesEachMessageTheStampsThatItLacks) {
    startAndConnect();
    reporting::Dictionary message;
    message.set("hyreporting_timestamp", 1.5).set("systemuptime_sec", 7);
    ASSERT_EQ(client_->broadcast(message, 1, 1), HALYARD_OK);
    ASSERT_TRUE(daemon_->waitForCalls(1));
    const Dictionary sent = daemon_->calls()[0].arguments.dictionary;
    EXPECT_EQ(sent["hyreporting_timestamp"].doubleValue(), 1.5);
    EXPECT_EQ(sent["systemuptime_sec"].integerValue(), 7);
    EXPECT_TRUE(sent["processuptime_ms"].isInteger());
    EXPECT_EQ(sent.size(), 3U);
}

TEST_F(ClientTest, TellsABroadcastFromAnEmptyList) {
    startAndConnect();
    const std::vector<std::int64_t> ids{5, -6};
    client_->broadcast(numbered(0), 1, 1);
    client_->send(numbered(1), 1, 1, {});
    client_->send(numbered(2), 1, 1, ids);
    ASSERT_TRUE(daemon_->waitForCalls(3));
    const Calls calls = daemon_->calls();
    EXPECT_FALSE(calls[0].arguments.reporterIDs.has_value());
    EXPECT_EQ(calls[1].arguments.reporterIDs, protocol::ReporterIDs{});
    EXPECT_EQ(calls[2].arguments.reporterIDs, ids);
}

TEST_F(ClientTest, AnswersQueries) {
    startAndConnect();
    daemon_->answerWith(Method::GetServiceNameForReporterID, {}, 13);
    daemon_->answerWith(Method::ReporterIDValid, {},
                        Dictionary{{"reporterID", 42}, {"serviceType", 3}});
    daemon_->answerWith(Method::GetAllReporters, {}, List{1, -2, 3});
    Mailbox<std::vector<std::int64_t>> box;
    client_->getServiceType(42, [&](auto* failure, std::uint16_t type) {
        box.put({codeOf(failure), type});
    });
    EXPECT_THAT(box.take(), ElementsAre(0, 13));
    client_->reporterValid(42, [&](auto* failure, std::int64_t id, std::uint16_t type) {
        box.put({codeOf(failure), id, type});
    });
    EXPECT_THAT(box.take(), ElementsAre(0, 42, 3));
    client_->getAllReporters([&](auto*, auto ids) { box.put({ids.begin(), ids.end()}); });
    EXPECT_THAT(box.take(), ElementsAre(1, -2, 3));
}

TEST_F(ClientTest, PassesTheDaemonsErrorOn) {
    startAndConnect();
    daemon_->answerWith(Method::GetServiceNameForReporterID,
                        Error{"com.kestrel.halyard.ipc", 3, "not allowed"}, {});
    Mailbox<reporting::Failure> box;
    client_->getServiceType(1, [&](const reporting::Failure* failure, std::uint16_t type) {
        EXPECT_EQ(type, HALYARD_SERVICE_UNKNOWN);
        box.put(failure != nullptr ? *failure : reporting::Failure{});
    });
    const reporting::Failure failure = box.take();
    EXPECT_EQ(failure.domain, "com.kestrel.halyard.ipc");
    EXPECT_EQ(failure.code, 3);
    EXPECT_EQ(failure.message, "not allowed");
}

TEST_F(ClientTest, SaysSoWhenAnAnswerIsOfAnotherShape) {
    startAndConnect();
    daemon_->answerWith(Method::GetAllReporters, {}, "what?");
    client_->getAllReporters([this](auto* failure, auto ids) {
        EXPECT_TRUE(ids.empty());
        stopped_.put(codeOf(failure));
    });
    EXPECT_EQ(stopped_.take(), HALYARD_ERROR_BAD_ANSWER);
}

TEST_F(ClientTest, HearsOfAStartWhenItsSessionIsStopped) {
    startAndConnect();
    reporting::Session session = client_->createSession(1);
    session.start(into(started_));
    ASSERT_TRUE(daemon_->waitForCalls(2));
    EXPECT_TRUE(started_.empty());
    session.stop(into(stopped_));
    EXPECT_EQ(started_.take(), 0);
    EXPECT_EQ(stopped_.take(), 0);
}

TEST_F(ClientTest, MakesItsSessionsAgainAfterARestart) {
    startAndConnect();
    reporting::Session session = client_->createSession(42);
    session.setServiceType(HALYARD_SERVICE_ALERTS);
    session.setConfiguration(reporting::Dictionary().set("a", 1));
    session.setConfiguration(reporting::Dictionary().set("b", 2));
    session.start();
    reporting::Session idle = client_->createSession(43);
    ASSERT_TRUE(daemon_->waitForCalls(6));
    stopDaemon();
    sendNumber(session, 1);
    daemon_->forgetCalls();
    daemon_->start();

    ASSERT_TRUE(daemon_->waitForCalls(6));
    const Calls calls = daemon_->calls();
    EXPECT_THAT(methodsOf(calls),
                ElementsAre(Method::CreateReportingSession, Method::SetServiceType,
                            Method::SetConfiguration, Method::StartReportingSessionForID,
                            Method::CreateReportingSession, Method::SendMessage));
    EXPECT_EQ(calls[2].arguments.dictionary, (Dictionary{{"a", 1}, {"b", 2}}));
    EXPECT_EQ(calls[4].arguments.reporterID, 43);
    EXPECT_EQ(client_->statistics().reconnects, 1U);
}

TEST_F(ClientTest, AHeldStartOutlivesARestart) {
    startAndConnect();
    reporting::Session session = client_->createSession(1);
    session.start(into(started_));
    ASSERT_TRUE(daemon_->waitForCalls(2));
    stopDaemon();
    daemon_->forgetCalls();
    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(2));
    EXPECT_TRUE(started_.empty());
    session.stop();
    EXPECT_EQ(started_.take(), 0);
}

TEST_F(ClientTest, DoesNotMakeAgainWhatWasDestroyedMeanwhile) {
    startAndConnect();
    reporting::Session gone = client_->createSession(1);
    reporting::Session stays = client_->createSession(2);
    ASSERT_TRUE(daemon_->waitForCalls(2));
    stopDaemon();
    gone = reporting::Session();
    daemon_->forgetCalls();
    daemon_->start();
    // Made again as the daemon knew it, then told what happened since.
    ASSERT_TRUE(daemon_->waitForCalls(3));
    EXPECT_EQ(daemon_->calls()[2].method, Method::DestroyReportingSession);
    stopDaemonAgain();
    daemon_->forgetCalls();
    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(1));
    EXPECT_EQ(daemon_->calls()[0].arguments.reporterID, 2);
}

TEST_F(ClientTest, FailsARequestWhoseConnectionBreaks) {
    startAndConnect();
    client_->killService(into(stopped_));
    ASSERT_TRUE(daemon_->waitForCalls(1));
    daemon_->stop();
    EXPECT_EQ(stopped_.take(), HALYARD_ERROR_CONNECTION_LOST);
}

TEST_F(ClientTest, KeepsMessagesForADaemonThatComesLater) {
    connect();
    ASSERT_FALSE(states_.take());
    reporting::Session session = client_->createSession(1);
    sendNumber(session, 1);
    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(2));
    EXPECT_EQ(daemon_->calls()[1].arguments.dictionary["n"].integerValue(), 1);
}

TEST_F(ClientTest, WithoutADaemonCountsWhatFindsNoRoom) {
    connect(64 * 1024);
    ASSERT_FALSE(states_.take());
    reporting::Session session = client_->createSession(1);
    int refused = 0;
    for (int i = 0; i < 2000; ++i) {
        refused += sendNumber(session, i) == HALYARD_QUEUE_FULL ? 1 : 0;
    }
    const halyard_statistics statistics = client_->statistics();
    EXPECT_GT(refused, 0);
    EXPECT_EQ(statistics.dropped_queue_full, static_cast<std::uint64_t>(refused));
    EXPECT_LE(statistics.queued_bytes, statistics.memory_limit);
    EXPECT_EQ(statistics.memory_limit, 64U * 1024);
}

TEST_F(ClientTest, TellsTheDaemonThatComesWhatItHadNoRoomFor) {
    connect(64 * 1024);
    ASSERT_FALSE(states_.take());
    reporting::Session session = client_->createSession(1);
    int refused = 0;
    for (int i = 0; i < 2000; ++i) {
        refused += sendNumber(session, i) == HALYARD_QUEUE_FULL ? 1 : 0;
    }
    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(1));
    EXPECT_EQ(daemon_->calls()[0].method, Method::ClientDropped);
    EXPECT_EQ(daemon_->calls()[0].arguments.dictionary, (Dictionary{{"queue_full", refused}}));
}

TEST_F(ClientTest, TellsWhatItLostWhenItEndsAndNothingTwice) {
    reporting::Dictionary broken;
    broken.beginList("open");
    connect();
    ASSERT_FALSE(states_.take());
    client_->broadcast(broken, 1, 1);
    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(1));
    stopDaemonAgain();
    daemon_->start();
    ASSERT_TRUE(states_.take());
    client_->broadcast(broken, 1, 1);
    client_->broadcast(broken, 1, 1);
    client_.reset();
    ASSERT_TRUE(daemon_->waitForEnds(1));
    const Calls calls = daemon_->calls();
    EXPECT_THAT(methodsOf(calls), ElementsAre(Method::ClientDropped, Method::ClientDropped));
    EXPECT_EQ(calls[0].arguments.dictionary, (Dictionary{{"invalid", 1}}));
    EXPECT_EQ(calls[1].arguments.dictionary, (Dictionary{{"invalid", 2}}));
}

// However long the daemon is away and whatever the queue holds, the sessions
// that it finds when it comes are those that live then.
TEST_F(ClientTest, WithoutADaemonForgetsMessagesRatherThanSessions) {
    connect(64 * 1024);
    ASSERT_FALSE(states_.take());
    reporting::Session lasting = client_->createSession(7);
    lasting.start(into(stopped_));
    while (sendNumber(lasting, 0) == HALYARD_OK) {
    }
    for (int i = 0; i < 2000; ++i) {
        reporting::Session passing;
        while (!passing) { // The queue is cut meanwhile.
            std::this_thread::yield();
            passing = client_->createSession(1000 + i);
        }
        passing.start();
    }
    EXPECT_GT(client_->statistics().dropped_discarded, 0U);

    daemon_->start();
    ASSERT_TRUE(daemon_->waitForCalls(2));
    const Calls calls = daemon_->calls();
    EXPECT_EQ(calls[0].arguments.reporterID, 7);
    EXPECT_EQ(calls[1].method, Method::StartReportingSessionForID);
    lasting.stop();
    EXPECT_EQ(stopped_.take(), 0);
}

TEST_F(ClientTest, AStuckDaemonHoldsNobodyUp) {
    daemon_->start(/*stuck=*/true);
    flushTimeoutMs_ = 1; // It will not take what is left.
    connect(64 * 1024);
    ASSERT_TRUE(states_.take());
    reporting::Session session = client_->createSession(1);
    const reporting::Dictionary big =
        std::move(reporting::Dictionary().set("text", std::string(8000, 'x')));
    do { // Until the socket's own buffer is full as well.
        while (session.send(big, 1, 1) != HALYARD_QUEUE_FULL) {
        }
    } while (client_->flush(50) == HALYARD_OK);
    EXPECT_EQ(session.stop(), HALYARD_OK); // There is room for what is no message.
    EXPECT_GT(client_->statistics().dropped_queue_full, 0U);
}

TEST_F(ClientTest, RefusesAMessageThatNoFrameTakes) {
    connect();
    reporting::Dictionary message;
    message.set("text", std::string(1024 * 1024 - 100, 'x'));
    EXPECT_EQ(client_->broadcast(message, 1, 1), HALYARD_TOO_LARGE);
    EXPECT_EQ(client_->statistics().dropped_too_large, 1U);
}

TEST_F(ClientTest, SendsAMessageThatAFrameJustTakes) {
    startAndConnect();
    reporting::Dictionary message;
    message.set("text", std::string(1024 * 1024 - 400, 'x'));
    EXPECT_EQ(client_->broadcast(message, 1, 1), HALYARD_OK);
    ASSERT_TRUE(daemon_->waitForCalls(1));
    EXPECT_EQ(daemon_->calls()[0].arguments.dictionary.size(), 4U);
}

TEST_F(ClientTest, ARangeIsSentAsAList) {
    startAndConnect();
    const std::vector<std::string> names{"speaker", "headphones"};
    const std::vector<std::vector<int>> rows{{1, 2}, {}};
    client_->broadcast(reporting::Dictionary().set("names", names).set("rows", rows).set("n", 1),
                       HALYARD_CATEGORY_IO, HALYARD_TYPE_START);

    ASSERT_TRUE(daemon_->waitForCalls(1));
    const Dictionary sent = daemon_->calls()[0].arguments.dictionary;
    EXPECT_EQ(sent["names"], Value(List{"speaker", "headphones"}));
    EXPECT_EQ(sent["rows"], Value(List{List{1, 2}, List{}}));
    EXPECT_EQ(sent["n"], Value(1));
}

TEST_F(ClientTest, RefusesABrokenDictionary) {
    connect();
    reporting::Dictionary message;
    message.beginList("open");
    EXPECT_EQ(client_->broadcast(message, 1, 1), HALYARD_INVALID);
    EXPECT_EQ(client_->statistics().dropped_invalid, 1U);
}

TEST_F(ClientTest, DestructionDeliversAndClosesItsSessions) {
    startAndConnect();
    reporting::Session session = client_->createSession(1);
    session.start();
    sendNumber(session, 5);
    client_.reset();
    ASSERT_TRUE(daemon_->waitForEnds(1));
    EXPECT_THAT(methodsOf(daemon_->calls()),
                ElementsAre(Method::CreateReportingSession, Method::StartReportingSessionForID,
                            Method::SendMessage, Method::StopReportingSessionForID,
                            Method::DestroyReportingSession));
    EXPECT_EQ(sendNumber(session, 6), HALYARD_CLOSED);
}

TEST_F(ClientTest, DestructionWithoutADaemonFailsWhatIsOpen) {
    connect();
    ASSERT_FALSE(states_.take());
    reporting::Session session = client_->createSession(1);
    session.start(into(stopped_));
    client_->getServiceType(
        1, [this](auto* failure, std::uint16_t) { stopped_.put(codeOf(failure)); });
    client_.reset(); // At once, although it may take a minute.
    EXPECT_EQ(stopped_.take(), HALYARD_ERROR_CLOSED);
    EXPECT_EQ(stopped_.take(), HALYARD_ERROR_CLOSED);
}

TEST_F(ClientTest, ACallbackMayReportButNotWait) {
    startAndConnect();
    client_->getAllReporters([this](auto*, auto) {
        stopped_.put(client_->flush(1000));
        stopped_.put(halyard_client_destroy(client_->get(), 1000));
        stopped_.put(client_->broadcast(numbered(1), 1, 1));
    });
    EXPECT_EQ(stopped_.take(), HALYARD_MISUSE);
    EXPECT_EQ(stopped_.take(), HALYARD_MISUSE);
    EXPECT_EQ(stopped_.take(), HALYARD_OK);
    EXPECT_TRUE(daemon_->waitForCalls(2));
}

TEST_F(ClientTest, ManyThreadsShareOneClient) {
    constexpr int kThreads = 4;
    constexpr int kEach = 500;
    startAndConnect();
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([this, thread] {
            reporting::Session session = client_->createSession(thread + 1);
            session.start();
            for (int i = 0; i < kEach; ++i) {
                EXPECT_EQ(sendNumber(session, i), HALYARD_OK);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(client_->flush(60'000), HALYARD_OK);
    ASSERT_TRUE(daemon_->waitForCalls(kThreads * (kEach + 4)));
    std::vector<int> next(kThreads, 0);
    for (const Call& call : daemon_->calls()) {
        if (call.method == Method::SendMessage) {
            const auto sender = static_cast<std::size_t>(call.arguments.reporterIDs->at(0) - 1);
            EXPECT_EQ(call.arguments.dictionary["n"].integerValue(), next[sender]++);
        }
    }
}

// In the child: exit status 0 when all is as it should be.
int useInChild(reporting::Client& client, reporting::Session& session,
               const reporting::Dictionary& message) {
    const bool refused = session.send(message, 1, 1) == HALYARD_FORKED &&
                         client.broadcast(message, 1, 1) == HALYARD_FORKED &&
                         client.flush(1000) == HALYARD_FORKED && !client.createSession();
    halyard_session_destroy(halyard_session_create(client.get(), 1));
    return refused && halyard_client_destroy(client.get(), 1000) == HALYARD_FORKED ? 0 : 1;
}

TEST_F(ClientTest, AForkedChildLeavesTheParentsConnectionAlone) {
    startAndConnect();
    reporting::Session session = client_->createSession(1);
    const reporting::Dictionary message = numbered(1);
    const pid_t child = ::fork();
    if (child == 0) {
        ::_exit(useInChild(*client_, session, message));
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    sendNumber(session, 2);
    ASSERT_TRUE(daemon_->waitForCalls(2));
    EXPECT_EQ(daemon_->calls()[1].arguments.dictionary["n"].integerValue(), 2);
}

TEST_F(ClientTest, TheDaemonSeesTheEndAlsoWhileAChildLivesOn) {
    startAndConnect();
    int pipe[2];
    ASSERT_EQ(::pipe(pipe), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        ::close(pipe[1]);
        char byte = 0;
        ::_exit(static_cast<int>(::read(pipe[0], &byte, 1))); // Until the parent is done.
    }
    client_.reset();
    EXPECT_TRUE(daemon_->waitForEnds(1));
    ::close(pipe[0]);
    ::close(pipe[1]);
    EXPECT_EQ(::waitpid(child, nullptr, 0), child);
}

TEST_F(ClientTest, TheExampleProgramReports) {
    daemon_->start();
    const std::string command = std::string(HALYARD_CLIENT_EXAMPLE) + ' ' + socket_;
    EXPECT_EQ(std::system(command.c_str()), 0);
    ASSERT_TRUE(daemon_->waitForEnds(1));
    const Calls calls = daemon_->calls();
    ASSERT_EQ(calls.size(), 8U);
    EXPECT_EQ(calls[4].arguments.dictionary["route"].text(), "speaker");
    EXPECT_EQ(calls[4].arguments.dictionary["sample_rate"].integerValue(), 48000);
    EXPECT_EQ(calls[5].arguments.dictionary["node"].text(), "Example Player");
}

TEST(DefaultSocketPathsTest, LooksWhereTheServiceManagerSaysFirst) {
    const auto environment = [](const char* name) -> const char* {
        return std::strcmp(name, "RUNTIME_DIRECTORY") == 0 ? "/run/a:/run/b" : "/run/user/7";
    };
    EXPECT_THAT(defaultSocketPaths(environment, false),
                ElementsAre("/run/a/reporting.sock", "/run/user/7/halyard/reporting.sock",
                            "/run/halyard/reporting.sock"));
    EXPECT_THAT(defaultSocketPaths(environment, true),
                ElementsAre("/run/a/reporting.sock", "/run/halyard/reporting.sock"));
}

TEST(DefaultSocketPathsTest, LooksInTheSystemsPlaceWithoutAnEnvironment) {
    const auto none = [](const char*) -> const char* { return nullptr; };
    EXPECT_THAT(defaultSocketPaths(none, false), ElementsAre("/run/halyard/reporting.sock"));
}

TEST(NullHandlesTest, AreAnsweredAndDoNothing) {
    EXPECT_EQ(halyard_client_destroy(nullptr, 0), HALYARD_INVALID);
    EXPECT_EQ(halyard_session_create(nullptr, 1), nullptr);
    EXPECT_EQ(halyard_session_send(nullptr, nullptr, 1, 1), HALYARD_INVALID);
    EXPECT_EQ(halyard_dictionary_set_int(nullptr, "a", 1), HALYARD_INVALID);
    halyard_session_destroy(nullptr);
    halyard_dictionary_destroy(nullptr);
}

TEST(LongPathTest, IsRefusedAtOnce) {
    EXPECT_EQ(halyard_client_create(std::string(200, 'x').c_str()), nullptr);
    EXPECT_EQ(errno, ENAMETOOLONG);
}

} // namespace
} // namespace halyard::client
