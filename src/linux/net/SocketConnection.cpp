#include "linux/net/SocketConnection.h"

#include <asio/post.hpp>
#include <cerrno>
#include <fmt/format.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <utility>

#include "linux/net/SpareCapacity.h"
#include "linux/queues/PooledSerialQueue.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

using protocol::FrameScanner;
using protocol::Method;

// What is done where it was read: more than this is done sooner by several threads.
constexpr std::size_t kFewBytes = 8 * 1024;
// What a connection takes that has nothing to do.
constexpr std::size_t kConnectionBytes = 2048;
// What an element takes beside its bytes, once it is decoded; a list of one has most.
constexpr std::size_t kElementBytes = 56;

bool needsAdministrator(Method method) {
    return method == Method::KillService || method == Method::AdminPostNotification ||
           method == Method::AdminFlush || method == Method::AdminStatus ||
           method == Method::AdminPurge;
}

std::string_view reason(FrameScanner::Outcome outcome) {
    switch (outcome) {
    case FrameScanner::Outcome::TooLarge:
        return "a frame larger than 1 MiB";
    case FrameScanner::Outcome::TooDeep:
        return "a frame nested deeper than 32";
    case FrameScanner::Outcome::TooManyElements:
        return "a frame of more than 65536 elements";
    default:
        return "bytes that are no MessagePack";
    }
}

} // namespace

// Counts the requests of one read until all their work is done.
class SocketConnection::ReadCharge final : public Charge {
public:
    explicit ReadCharge(std::shared_ptr<SocketConnection> connection)
        : Charge(connection->budget_), connection_(std::move(connection)) {}
    ~ReadCharge() override {
        client()->end(platform::ClientBudget::Work::Requests, requests_, memory_);
        connection_->workDone(requests_, bytes_);
    }

    // `memory` is what it takes once it is decoded.
    void add(std::size_t bytes, std::size_t memory) {
        client()->begin(platform::ClientBudget::Work::Requests, memory);
        ++requests_;
        bytes_ += bytes;
        memory_ += memory;
        connection_->unprocessedRequests_.fetch_add(1);
        connection_->unprocessedBytes_.fetch_add(bytes);
    }

private:
    const std::shared_ptr<SocketConnection> connection_;
    std::size_t requests_ = 0;
    std::size_t bytes_ = 0;
    std::size_t memory_ = 0;
};

// Sends the answer to one request back, if its connection is still there.
class SocketConnection::SocketResponder final : public protocol::Responder {
public:
    SocketResponder(std::weak_ptr<SocketConnection> connection, std::uint32_t messageID)
        : connection_(std::move(connection)), messageID_(messageID) {}

    void answer(const MaybeError& error, const Value& result) override {
        if (const auto connection = connection_.lock()) {
            std::string bytes;
            protocol::appendAnswer(bytes, messageID_, error, result);
            connection->send(bytes);
        }
    }

private:
    const std::weak_ptr<SocketConnection> connection_;
    const std::uint32_t messageID_;
};

SocketConnection::SocketConnection(asio::local::stream_protocol::socket socket, Peer peer,
                                   PeerRights rights, platform::ClientBudgetPtr budget,
                                   ListenerShared& shared)
    : socket_(std::move(socket)), peer_(std::move(peer)), rights_(rights),
      budget_(std::move(budget)), ownBytes_(budget_), shared_(shared), pendingBytes_(budget_),
      outBytes_(budget_) {
    (void)ownBytes_.resize(kConnectionBytes);
}

SocketConnection::~SocketConnection() {
    budget_->removeConnection();
}

std::string SocketConnection::description() const {
    return peer_.description();
}

void SocketConnection::setExportedObject(std::shared_ptr<platform::ExportedObject> object) {
    exported_ = std::move(object);
}

void SocketConnection::setInterruptionHandler(std::function<void()> handler) {
    interruptionHandler_ = std::move(handler);
}

void SocketConnection::setInvalidationHandler(std::function<void()> handler) {
    invalidationHandler_ = std::move(handler);
}

void SocketConnection::resume() {
    readIfAllowed();
}

bool SocketConnection::mayRead() const {
    return unprocessedRequests_.load() < kMaxUnprocessedRequests &&
           unprocessedBytes_.load() < kMaxUnprocessedBytes &&
           (unsentBytes_.load() <= kUnsentPause || finishing_) && !budget_->isBusy() &&
           !shared_.pressure.isOn();
}

// How a connection stops reading and goes on.
//
// Whether it may read depends on five things that end on five threads: its
// charges and those of its process (on whichever worker lets go of the last one),
// its unsent answers (here, or where an answer is made), what its process has on its
// way to the disk, the pressure (the store's thread, the background one). None of them knows how
// the others stand. So there is one question, mayRead(), that is asked again each time one of them
// has ended, and never an answer that is kept.
//
// What must not happen is that the last one ends between the question and the
// pause, so that nobody asks again. Hence `paused_` is set first and the question
// asked a second time: either this sees the end, or who ends it sees `paused_`.
//
// Frames that came in whole may be in hand when a bound stops them, up to a read
// and the frame that was begun before it. The socket is waited for only once
// these are taken: the peer may be waiting for their answers and send nothing.
//
// A peer that left is noticed in two ways. When there is nothing to read any
// more, the connection ends. When an answer cannot be written, answers are no
// longer kept, which may be what reading was stopped by; what the peer wrote is
// read on, under the same bounds, up to the end of it. That end is certain: what
// can still come is what fits into a socket's buffer, unless the peer is alive
// and only takes no answers, and then it is one that costs what any other does.
bool SocketConnection::pausesReading() {
    if (mayRead()) {
        return false;
    }
    paused_.store(true);
    if (!mayRead()) {
        return true; // workDone(), writeSome() or the pressure's end calls again.
    }
    paused_.store(false);
    return false;
}

void SocketConnection::readIfAllowed() {
    if (ended_ || waiting_) {
        return;
    }
    while (!pausesReading()) {
        if (!framesWait_) {
            peerFinished_ ? end(ending_) : waitReadable();
            return;
        }
        pending_.erase(0, takeFrames(pending_));
        if (ended_) {
            return;
        }
    }
}

void SocketConnection::waitReadable() {
    waiting_ = true;
    socket_.async_wait(asio::socket_base::wait_read,
                       [self = shared_from_this()](const asio::error_code& error) {
                           self->waiting_ = false;
                           if (!error && !self->ended_) {
                               self->waiting_ = true; // for its turn
                               self->shared_.turns.ask(self);
                           }
                       });
}

void SocketConnection::readAvailable() {
    waiting_ = false;
    if (ended_) {
        return;
    }
    if (!mayRead()) {
        readIfAllowed();
        return;
    }
    const ssize_t got =
        ::recv(socket_.native_handle(), shared_.buffer.data(), shared_.buffer.size(), MSG_DONTWAIT);
    if (got < 0 && errno != EAGAIN && errno != EINTR) {
        end(Ending::Broken);
        return;
    }
    peerFinished_ = got == 0;
    if (got > 0) {
        takeChunk(std::string_view(shared_.buffer.data(), static_cast<std::size_t>(got)));
    }
    readIfAllowed();
}

// Answers that are made meanwhile are written once, at the end.
void SocketConnection::takeChunk(std::string_view chunk) {
    shared_.counters.bytesRead += chunk.size();
    shared_.reading = this;
    if (pending_.empty()) {
        const std::size_t taken = takeFrames(chunk);
        pending_.assign(chunk.substr(taken));
    } else {
        pending_ += chunk;
        pending_.erase(0, takeFrames(pending_));
    }
    shared_.reading = nullptr;
    if (pending_.empty()) {
        dropSpareCapacity(pending_);
    }
    chargePending();
    if (std::exchange(answersWait_, false)) {
        writeSome();
    }
}

bool SocketConnection::isReadHere() const {
    return shared_.context.get_executor().running_in_this_thread() && shared_.reading == this;
}

void SocketConnection::chargePending() {
    if (!ended_ && !pendingBytes_.resize(chargedFor(pending_))) {
        breakOff(platform::boundReached(platform::ClientBound::Memory).message);
    }
}

std::size_t SocketConnection::takeFrames(std::string_view stream) {
    const auto charge = std::make_shared<ReadCharge>(shared_from_this());
    const ChargeScope scope(charge);
    WakeUpScope wakeUps(shared_.lendsThread && stream.size() <= kFewBytes
                            ? WakeUpScope::Thread::Lent
                            : WakeUpScope::Thread::Kept);
    std::size_t taken = 0;
    framesWait_ = false;
    while (taken < stream.size() && !ended_) {
        if (!mayRead()) {
            framesWait_ = true;
            break;
        }
        const std::string_view rest = stream.substr(taken);
        const auto outcome = scanner_.scan(rest);
        if (outcome == FrameScanner::Outcome::Incomplete) {
            break;
        }
        if (outcome != FrameScanner::Outcome::Complete) {
            breakOff(reason(outcome));
            break;
        }
        const std::size_t length = scanner_.frameLength();
        const std::size_t memory = length + scanner_.elements() * kElementBytes;
        scanner_.reset();
        taken += length;
        if (!takeFrame(rest.substr(0, length), memory, charge, wakeUps)) {
            breakOff("a frame that is no MessagePack-RPC request");
            break;
        }
    }
    return taken;
}

bool SocketConnection::takeFrame(std::string_view frame, std::size_t memory,
                                 const std::shared_ptr<ReadCharge>& charge, WakeUpScope& wakeUps) {
    auto call = shared_.decoder.decode(frame);
    if (!call) {
        return false;
    }
    ++shared_.counters.requests;
    if (call->error || !call->method) {
        refuseCall(*call, std::move(call->error));
        return true;
    }
    if (needsAdministrator(*call->method) && rights_ != PeerRights::Administrator) {
        refuseCall(*call, Error{std::string(kIpcErrorDomain),
                                static_cast<std::int64_t>(IpcErrorCode::NotAllowed),
                                fmt::format("{} is not allowed for uid {}",
                                            protocol::methodName(*call->method), peer_.uid)});
        return true;
    }
    if (needsAdministrator(*call->method)) {
        wakeUps.keepThread(); // What it waits for may have to be done by this thread.
    }
    charge->add(frame.size(), memory);
    protocol::Reply reply;
    if (call->messageID) {
        reply =
            protocol::Reply(std::make_unique<SocketResponder>(weak_from_this(), *call->messageID));
    }
    exported_->handle({*call->method, std::move(call->arguments), std::move(reply)});
    return true;
}

void SocketConnection::refuseCall(const protocol::Call& call, MaybeError error) {
    ++shared_.counters.badRequests;
    if (call.messageID) {
        std::string bytes;
        protocol::appendAnswer(bytes, *call.messageID, error, Value());
        send(bytes);
    }
}

void SocketConnection::closeUnlessLeft(bool complete) {
    writeSome();
    if (finishing_) {
        stopAnswering(); // What can still come is little, and is not held up by this.
    } else if (ending_ != Ending::Broken && !(complete && unsentBytes_.load() == 0)) {
        breakOff("answers left lying");
    }
}

void SocketConnection::workDone(std::size_t requests, std::size_t bytes) {
    unprocessedRequests_.fetch_sub(requests);
    unprocessedBytes_.fetch_sub(bytes);
    if (paused_.exchange(false)) {
        asio::post(socket_.get_executor(), [self = shared_from_this()] { self->readIfAllowed(); });
    }
}

void SocketConnection::breakOff(std::string_view why) {
    if (ended_) {
        return;
    }
    HY_LOG_ERROR(HYReportingPlatformCategory, "closing connection {}: {}", description(), why);
    ++shared_.counters.broken;
    end(Ending::Broken);
}

void SocketConnection::close() {
    end(Ending::Closed);
}

// The kernel draws the line: what it has taken from the peer can be read, and then comes
// the end of it; it takes nothing more.
void SocketConnection::finish() {
    if (ended_) {
        return;
    }
    finishing_ = true;
    (void)::shutdown(socket_.native_handle(), SHUT_RD);
    readIfAllowed();
}

std::size_t SocketConnection::unreadBytes() {
    int waiting = 0;
    (void)::ioctl(socket_.native_handle(), FIONREAD, &waiting);
    return pending_.size() + static_cast<std::size_t>(waiting);
}

void SocketConnection::end(Ending ending) {
    if (std::exchange(ended_, true)) {
        return;
    }
    const auto self = shared_from_this();
    const ChargeScope scope(std::make_shared<Charge>(budget_)); // Behind what it asked for.
    stopAnswering();
    asio::error_code ignored;
    socket_.close(ignored);
    shared_.remove(self, peer_.pid);
    if (ending == Ending::Broken && interruptionHandler_) {
        interruptionHandler_();
    }
    if (invalidationHandler_) {
        invalidationHandler_();
    }
    interruptionHandler_ = nullptr;
    invalidationHandler_ = nullptr;
    exported_ = nullptr;
}

} // namespace halyard::linux_
