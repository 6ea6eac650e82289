// The thread behind a client: takes records from the queue, writes them to the
// daemon in large blocks, reads the answers, and keeps the connection alive.
//
// Every step does what can be done without waiting; wait() is the one place
// where the thread sleeps. A record leaves the queue when its frame has been
// written in full; when the connection breaks, what was not written is written
// to the next one, behind the calls that make the sessions again.
//
// While the daemon is away or does not read, the queue fills up and messages are
// refused. The other requests keep a reserve for themselves; when they have used
// half of it, the oldest part of the queue is cut: messages are given up, and the
// rest goes into the table of sessions as if it had been sent.
//
// Runs on its own thread only.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

#include "client/AnswerReader.h"
#include "client/Backoff.h"
#include "client/Client.h"
#include "client/Connection.h"
#include "client/LossReport.h"
#include "client/Outbox.h"
#include "client/Replies.h"
#include "client/SessionTable.h"

namespace halyard::client {

class Worker {
public:
    // Borrows the client, which outlives run().
    explicit Worker(Client& client);

    void run();

private:
    using SteadyTime = Client::SteadyTime;

    void step();
    bool finished();
    bool isDelivered() const;
    void giveUpRest();

    // Connection
    void connectIfDue();
    bool openAny();
    void recreateSessions();
    void lose();
    void tellState(halyard_connection_state state);

    // Queue to socket. fill() and pump() say whether there is more to do at once.
    bool pump();
    void fill();
    void takeWritten();
    void finishRecord(const Record& record, std::optional<std::uint32_t> messageID);
    void destroyAbandoned();
    void sayGoodbye();
    bool queueIsRead() const;
    bool isStalled() const;

    // When there is no delivering
    void cutIfNeeded();
    void giveUp(const Record& record, std::int64_t code);

    // Sleeping and answers
    struct Sleep {
        std::uint64_t wakeAbove; // queued bytes
        std::optional<std::chrono::milliseconds> time;
    };
    Sleep chooseSleep() const;
    std::optional<std::chrono::milliseconds> newsSince(const Sleep& sleep) const;
    int timeoutOf(Sleep sleep) const;
    void wait(bool moreToDo);
    void readAnswers();

    Client& client_;
    Connection connection_;
    AnswerReader reader_;
    Outbox outbox_;
    Replies replies_;
    SessionTable table_;
    Backoff backoff_;
    LossReport lossReport_;

    std::uint64_t cursor_ = 0; // Up to here the queue is in the outbox.
    std::uint32_t nextMessageID_ = 1;
    bool wouldBlock_ = false; // The socket took no more.
    bool busy_ = false;       // Something was queued since the last sleep.
    SteadyTime lastBusy_;
    bool answersReady_ = false;

    std::optional<halyard_connection_state> toldState_;
    bool everConnected_ = false;
    SteadyTime connectedAt_;
    SteadyTime nextAttempt_; // The first one at once.

    bool closingSeen_ = false;
    bool goodbyeSaid_ = false;
    bool noDaemon_ = false; // An attempt failed while closing.
};

} // namespace halyard::client
