// The way out of a connection: answers gather in a buffer and leave it on the loop's thread.
#include <asio/post.hpp>
#include <cerrno>
#include <sys/socket.h>

#include "linux/net/SocketConnection.h"
#include "linux/net/SpareCapacity.h"

namespace halyard::linux_ {

void SocketConnection::send(std::string_view bytes) {
    const MutexLock lock(outMutex_);
    if (deaf_ || out_.size() > kMaxUnsentBytes) {
        return; // Gone, or on its way to being closed.
    }
    out_ += bytes;
    unsentBytes_.store(out_.size());
    if (out_.size() > kMaxUnsentBytes || !outBytes_.resize(chargedFor(out_))) {
        const bool complete = out_.size() <= kMaxUnsentBytes;
        asio::post(socket_.get_executor(),
                   [self = shared_from_this(), complete] { self->closeUnlessLeft(complete); });
    } else if (!writeScheduled_) {
        writeScheduled_ = true;
        scheduleWriting();
    }
}

void SocketConnection::scheduleWriting() {
    if (isReadHere()) {
        answersWait_ = true;
    } else {
        asio::post(socket_.get_executor(), [self = shared_from_this()] { self->writeSome(); });
    }
}

SocketConnection::Written SocketConnection::writeOnce() {
    const MutexLock lock(outMutex_);
    if (out_.empty()) {
        return Written::All; // The peer has become deaf meanwhile.
    }
    const ssize_t sent =
        ::send(socket_.native_handle(), out_.data(), out_.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent < 0 && errno != EAGAIN && errno != EINTR) {
        return Written::Refused;
    }
    out_.erase(0, sent > 0 ? static_cast<std::size_t>(sent) : 0);
    unsentBytes_.store(out_.size());
    writeScheduled_ = !out_.empty();
    if (out_.empty()) {
        dropSpareCapacity(out_);
        (void)outBytes_.resize(chargedFor(out_)); // Which is less.
    }
    return out_.empty() ? Written::All : Written::Some;
}

void SocketConnection::writeSome() {
    if (ended_) {
        return;
    }
    const Written written = writeOnce();
    if (written == Written::Refused) {
        ending_ = Ending::Broken;
        stopAnswering();
    } else if (written == Written::Some) {
        socket_.async_wait(asio::socket_base::wait_write,
                           [self = shared_from_this()](const asio::error_code& error) {
                               if (!error) {
                                   self->writeSome();
                               }
                           });
    }
    if (paused_.load()) {
        readIfAllowed();
    }
}

void SocketConnection::stopAnswering() {
    const MutexLock lock(outMutex_);
    deaf_ = true;
    out_ = std::string();
    (void)outBytes_.resize(0);
    unsentBytes_.store(0);
}

// Answers for which there is no room may go at once, if none has been dropped.

} // namespace halyard::linux_
