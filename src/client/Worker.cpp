#include "client/Worker.h"

#include <poll.h>
#include <sched.h>

#include <algorithm>
#include <limits>
#include <utility>

#include "client/Frames.h"

namespace halyard::client {
namespace {

using protocol::Method;
using std::chrono::steady_clock;

// Further requests wait in the queue while so many wait for their answers.
constexpr std::size_t kMaxInFlight = 1024;

bool endsStart(Method method) {
    return method == Method::CreateReportingSession ||
           method == Method::StopReportingSessionForID || method == Method::DestroyReportingSession;
}

} // namespace

Worker::Worker(Client& client)
    : client_(client), backoff_(client.settings().retryFirst, client.settings().retryLast) {}

void Worker::run() {
    while (!finished()) {
        try {
            step();
        } catch (...) {
            // Out of memory: the process is the host's and goes on. A new
            // connection starts from what the queue and the table hold.
            lose();
        }
    }
    giveUpRest();
    client_.announceReleased();
}

void Worker::step() {
    connectIfDue();
    const bool more = connection_.isOpen() && pump();
    cutIfNeeded();
    client_.announceReleased();
    if (closingSeen_ && isDelivered()) {
        return; // Nothing to wait for.
    }
    wait(more);
    if (connection_.isOpen() && answersReady_) {
        readAnswers();
    }
}

// ---- Connection ---------------------------------------------------------------

void Worker::connectIfDue() {
    if (connection_.isOpen() || steady_clock::now() < nextAttempt_) {
        return;
    }
    if (!openAny()) {
        nextAttempt_ = steady_clock::now() + backoff_.next();
        noDaemon_ = closingSeen_;
        tellState(HALYARD_DISCONNECTED);
        return;
    }
    connectedAt_ = steady_clock::now();
    client_.counters().reconnects.fetch_add(everConnected_ ? 1 : 0, std::memory_order_relaxed);
    everConnected_ = true;
    recreateSessions();
    lossReport_.append(outbox_.bytes(), client_.losses());
    tellState(HALYARD_CONNECTED);
}

bool Worker::openAny() {
    for (const std::string& path : client_.settings().socketPaths) {
        if (connection_.open(path)) {
            return true;
        }
    }
    return false;
}

void Worker::recreateSessions() {
    for (auto& [order, session] : table_.sessions()) {
        appendRecreation(outbox_.bytes(), session);
        if (!session.started) {
            continue;
        }
        std::optional<std::uint32_t> messageID;
        if (session.stopped) {
            messageID = nextMessageID_++;
            replies_.hold(*messageID, std::exchange(session.stopped, {}), session.reporterID);
        }
        appendSessionCall(outbox_.bytes(), messageID, Method::StartReportingSessionForID,
                          session.reporterID);
    }
}

void Worker::lose() {
    if (!connection_.isOpen()) {
        return;
    }
    lossReport_.gone();
    connection_.close();
    reader_.reset();
    outbox_.clear();
    cursor_ = client_.ring().releasedTo();
    wouldBlock_ = false;
    for (const auto& [reporterID, stopped] : replies_.takeHeld()) {
        table_.keepStartReply(reporterID, stopped);
    }
    replies_.failAll(HALYARD_ERROR_CONNECTION_LOST);
    const SteadyTime now = steady_clock::now();
    backoff_.connectionEnded(now - connectedAt_);
    nextAttempt_ = now + backoff_.next();
    tellState(HALYARD_DISCONNECTED);
}

void Worker::tellState(halyard_connection_state state) {
    const Settings& settings = client_.settings();
    if (toldState_ != state && settings.connectionChanged != nullptr) {
        settings.connectionChanged(settings.context, state);
    }
    toldState_ = state;
}

// ---- Queue to socket ------------------------------------------------------------

bool Worker::queueIsRead() const {
    return cursor_ == client_.queue().end();
}

bool Worker::isStalled() const {
    return replies_.inFlight() >= kMaxInFlight;
}

bool Worker::pump() {
    if (outbox_.allWritten()) {
        outbox_.clear();
        fill();
    }
    wouldBlock_ = false;
    while (!outbox_.allWritten() && !wouldBlock_) {
        std::size_t count = 0;
        const Connection::Outcome outcome = connection_.send(outbox_.unwritten(), count);
        if (outcome == Connection::Outcome::Lost) {
            lose();
            return false;
        }
        outbox_.advance(count);
        wouldBlock_ = outcome == Connection::Outcome::WouldBlock;
    }
    takeWritten();
    if (outbox_.allWritten()) {
        lossReport_.written();
    }
    if (queueIsRead() && outbox_.allWritten()) {
        client_.ring().rewind();
        cursor_ = client_.ring().releasedTo();
    }
    MessageRing::Record next;
    return !wouldBlock_ && !isStalled() && client_.ring().read(cursor_, next);
}

void Worker::fill() {
    MessageRing::Record next;
    std::size_t requests = replies_.inFlight();
    while (outbox_.hasRoom() && requests < kMaxInFlight && client_.ring().read(cursor_, next)) {
        const auto& record = *reinterpret_cast<const Record*>(next.bytes);
        std::optional<std::uint32_t> messageID;
        if (record.callback) {
            messageID = nextMessageID_++;
            ++requests;
        }
        appendFrame(outbox_.bytes(), messageID, record);
        outbox_.addFrame({&record, next.next, messageID});
        cursor_ = next.next;
        busy_ = true;
    }
    if (queueIsRead()) {
        destroyAbandoned();
    }
}

void Worker::takeWritten() {
    while (const Outbox::Frame* frame = outbox_.takeWritten()) {
        finishRecord(*frame->record, frame->messageID);
        client_.ring().release(frame->next);
    }
}

void Worker::finishRecord(const Record& record, std::optional<std::uint32_t> messageID) {
    if (record.isMessage()) {
        client_.counters().sent.fetch_add(1, std::memory_order_relaxed);
    }
    if (endsStart(record.method)) {
        replies_.letGo(record.reporterID);
    }
    const bool startsIt = table_.apply(record);
    if (messageID && startsIt) {
        replies_.hold(*messageID, record.callback, record.reporterID);
    } else if (messageID) {
        replies_.add(*messageID, record.callback);
    }
}

// Lost before they are written, these calls are not missed: the daemon forgets
// the sessions of a lost connection, and the table has forgotten them here.
void Worker::destroyAbandoned() {
    Abandoned* next = client_.takeAbandoned();
    while (next != nullptr) {
        const std::unique_ptr<Abandoned> session(next);
        next = session->next;
        if (session->started) {
            appendSessionCall(outbox_.bytes(), std::nullopt, Method::StopReportingSessionForID,
                              session->reporterID);
        }
        appendSessionCall(outbox_.bytes(), std::nullopt, Method::DestroyReportingSession,
                          session->reporterID);
        replies_.letGo(session->reporterID);
        fail(table_.takeStartReply(session->reporterID), HALYARD_ERROR_DISCARDED);
        table_.erase(session->reporterID);
    }
}

// A stop of its own for each session, because the daemon keeps counting a
// session as active that merely vanishes with its connection.
void Worker::sayGoodbye() {
    goodbyeSaid_ = true;
    for (const auto& [order, session] : table_.sessions()) {
        if (session.started) {
            appendSessionCall(outbox_.bytes(), std::nullopt, Method::StopReportingSessionForID,
                              session.reporterID);
        }
        appendSessionCall(outbox_.bytes(), std::nullopt, Method::DestroyReportingSession,
                          session.reporterID);
        replies_.letGo(session.reporterID);
    }
    lossReport_.append(outbox_.bytes(), client_.losses());
}

// ---- When there is no delivering ------------------------------------------------

void Worker::cutIfNeeded() {
    MessageRing& ring = client_.ring();
    if (ring.used() <= client_.cutMark() || (connection_.isOpen() && !wouldBlock_)) {
        return;
    }
    lose(); // Or the table would say more than a daemon that does not read has heard.
    MessageRing::Record next;
    while (ring.used() > client_.messageLimit() && ring.read(ring.releasedTo(), next)) {
        giveUp(*reinterpret_cast<const Record*>(next.bytes), HALYARD_ERROR_DISCARDED);
        ring.release(next.next);
    }
    cursor_ = ring.releasedTo();
}

void Worker::giveUp(const Record& record, std::int64_t code) {
    if (record.isMessage()) {
        client_.counters().discarded.fetch_add(1, std::memory_order_relaxed);
    }
    if (endsStart(record.method)) {
        fail(table_.takeStartReply(record.reporterID), code);
    }
    const bool startsIt = table_.apply(record);
    if (startsIt && record.callback) {
        table_.keepStartReply(record.reporterID, record.callback);
    } else {
        fail(record.callback, code);
    }
}

// ---- Sleeping and answers -------------------------------------------------------

Worker::Sleep Worker::chooseSleep() const {
    using std::chrono::milliseconds;
    // Time for more to come, so that a stream of messages is taken in blocks; and
    // naps for a while after it, so that neither its writers nor those of single
    // messages now and then have to wake anybody.
    constexpr milliseconds kLinger{10};
    constexpr milliseconds kNap{50};
    constexpr milliseconds kNapFor{1000};
    if (!connection_.isOpen()) {
        const auto left = std::chrono::ceil<milliseconds>(nextAttempt_ - steady_clock::now());
        return {client_.cutMark(), std::max(left, milliseconds{0})};
    }
    if (wouldBlock_ || isStalled()) {
        return {client_.cutMark(), std::nullopt};
    }
    if (busy_ || steady_clock::now() < lastBusy_ + kNapFor) {
        return {client_.queue().capacity() / 4, busy_ ? kLinger : kNap};
    }
    return {0, std::nullopt};
}

// Something that came between the last look and arm(), and was not told.
std::optional<std::chrono::milliseconds> Worker::newsSince(const Sleep& sleep) const {
    using std::chrono::milliseconds;
    if (client_.isClosing() && !closingSeen_) {
        return milliseconds{0};
    }
    if (sleep.wakeAbove != 0) {
        const bool tooMuch = client_.queue().used() > sleep.wakeAbove;
        return tooMuch ? std::optional(milliseconds{0}) : std::nullopt;
    }
    if (queueIsRead() && !client_.hasAbandoned()) {
        return std::nullopt;
    }
    // A writer may be about to publish what it claimed: it will not tell again.
    MessageRing::Record next;
    return milliseconds{client_.queue().read(cursor_, next) ? 0 : 1};
}

int Worker::timeoutOf(Sleep sleep) const {
    using std::chrono::milliseconds;
    if (closingSeen_) {
        const auto left =
            std::chrono::ceil<milliseconds>(client_.closingDeadline() - steady_clock::now());
        sleep.time = std::clamp(left, milliseconds{0}, sleep.time.value_or(milliseconds::max()));
    }
    // Longer ones are slept in several naps.
    constexpr milliseconds kLongest{std::numeric_limits<int>::max()};
    return sleep.time ? static_cast<int>(std::min(*sleep.time, kLongest).count()) : -1;
}

void Worker::wait(bool moreToDo) {
    Sleep sleep{0, std::chrono::milliseconds{0}};
    if (!moreToDo) {
        sleep = chooseSleep();
        client_.wakeUp().arm(sleep.wakeAbove);
        if (const auto sooner = newsSince(sleep)) {
            sleep.time = sooner;
        }
    }
    if (std::exchange(busy_, false)) {
        lastBusy_ = steady_clock::now();
    }
    const int unwritten = outbox_.allWritten() ? 0 : POLLOUT;
    // Poll passes over a descriptor of -1.
    pollfd watched[2] = {{client_.wakeUp().descriptor(), POLLIN, 0},
                         {connection_.descriptor(), static_cast<short>(POLLIN | unwritten), 0}};
    ::poll(watched, 2, timeoutOf(sleep));
    client_.wakeUp().disarm();
    answersReady_ = (watched[1].revents & ~POLLOUT) != 0;
}

void Worker::readAnswers() {
    const auto take = [this](const protocol::Answer& answer) { replies_.deliver(answer); };
    if (!reader_.read(connection_, take)) {
        lose();
    }
}

// ---- The end --------------------------------------------------------------------

bool Worker::isDelivered() const {
    return connection_.isOpen() && queueIsRead() && outbox_.allWritten() && replies_.empty();
}

bool Worker::finished() {
    if (!client_.isClosing()) {
        return false;
    }
    if (!std::exchange(closingSeen_, true)) {
        nextAttempt_ = steady_clock::now(); // One more attempt, without delay.
    }
    if (noDaemon_ || steady_clock::now() >= client_.closingDeadline()) {
        return true;
    }
    if (!queueIsRead() || !outbox_.allWritten()) {
        return false;
    }
    if (!connection_.isOpen()) {
        return true;
    }
    if (!goodbyeSaid_) {
        destroyAbandoned();
        sayGoodbye();
    }
    return isDelivered();
}

void Worker::giveUpRest() {
    MessageRing& ring = client_.ring();
    bool leftovers = !outbox_.allWritten() || !replies_.empty();
    connection_.close();
    outbox_.clear();
    while (ring.releasedTo() != ring.end()) {
        MessageRing::Record next;
        if (!ring.read(ring.releasedTo(), next)) {
            ::sched_yield(); // Its writer was before the seal, and is about to publish.
            continue;
        }
        giveUp(*reinterpret_cast<const Record*>(next.bytes), HALYARD_ERROR_CLOSED);
        ring.release(next.next);
        leftovers = true;
    }
    for (const Callback& stopped : table_.takeAllStartReplies()) {
        fail(stopped, HALYARD_ERROR_CLOSED);
    }
    replies_.failAll(HALYARD_ERROR_CLOSED);
    if (leftovers) {
        client_.reportLeftovers();
    }
}

} // namespace halyard::client
