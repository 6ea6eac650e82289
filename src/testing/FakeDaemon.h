// For tests: a daemon on a real socket that records the calls it gets and answers
// like the real one (a start when its session is stopped). One thread; every
// method may be called from the test's thread.
#pragma once

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "protocol/Wire.h"

namespace halyard::testing {

class FakeDaemon {
public:
    using Calls = std::vector<protocol::Call>;

    explicit FakeDaemon(std::string path) : path_(std::move(path)) {}
    ~FakeDaemon() { stop(); }

    // A stuck one takes connections and never reads.
    void start(bool stuck = false) {
        std::filesystem::remove(path_);
        listener_ = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, path_.c_str(), path_.size() + 1);
        if (::bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof(address)) != 0 ||
            ::listen(listener_, 16) != 0) {
            std::abort();
        }
        wake_ = ::eventfd(0, EFD_CLOEXEC);
        thread_ = std::thread([this, stuck] { serve(stuck); });
    }

    // Closes everything, as the end of the daemon does; what is recorded stays.
    void stop() {
        if (!thread_.joinable()) {
            return;
        }
        ::eventfd_write(wake_, 1);
        thread_.join();
        ::close(wake_);
        ::close(listener_);
        std::filesystem::remove(path_);
    }

    // Waits until `condition` holds for the calls so far.
    [[nodiscard]] bool waitUntil(const std::function<bool(const Calls&)>& condition) {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return condition(calls_); });
    }
    [[nodiscard]] bool waitForCalls(std::size_t count) {
        return waitUntil([count](const Calls& calls) { return calls.size() >= count; });
    }
    // Waits until `count` connections have ended since start().
    [[nodiscard]] bool waitForEnds(std::size_t count) {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(60), [&] { return ends_ >= count; });
    }
    Calls calls() {
        const std::lock_guard lock(mutex_);
        return calls_;
    }
    void forgetCalls() {
        const std::lock_guard lock(mutex_);
        calls_.clear();
    }
    // What a query is answered with; everything else is answered true.
    void answerWith(protocol::Method method, MaybeError error, Value result) {
        const std::lock_guard lock(mutex_);
        answers_[method] = {std::move(error), std::move(result)};
    }

private:
    struct Peer {
        int descriptor;
        std::string stream;
        protocol::FrameScanner scanner;
        std::map<std::int64_t, std::uint32_t> heldStarts;
    };

    void serve(bool stuck) {
        std::vector<Peer> peers;
        while (true) {
            std::vector<pollfd> watched{{wake_, POLLIN, 0}, {listener_, POLLIN, 0}};
            for (const Peer& peer : peers) {
                watched.push_back({stuck ? -1 : peer.descriptor, POLLIN, 0});
            }
            ::poll(watched.data(), watched.size(), -1);
            if (watched[0].revents != 0) {
                break;
            }
            for (std::size_t i = peers.size(); i-- > 0;) {
                if (watched[2 + i].revents != 0 && !read(peers[i])) {
                    ::close(peers[i].descriptor);
                    peers.erase(peers.begin() + static_cast<std::ptrdiff_t>(i));
                    noteEnd();
                }
            }
            if (watched[1].revents != 0) {
                peers.push_back({::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC), {}, {}, {}});
            }
        }
        for (const Peer& peer : peers) {
            ::close(peer.descriptor);
        }
    }

    void noteEnd() {
        const std::lock_guard lock(mutex_);
        ++ends_;
        changed_.notify_all();
    }

    bool read(Peer& peer) {
        char chunk[65536];
        const ssize_t count = ::recv(peer.descriptor, chunk, sizeof(chunk), 0);
        if (count <= 0) {
            return false;
        }
        peer.stream.append(chunk, static_cast<std::size_t>(count));
        while (!peer.stream.empty() &&
               peer.scanner.scan(peer.stream) == protocol::FrameScanner::Outcome::Complete) {
            const std::size_t length = peer.scanner.frameLength();
            take(peer, std::string_view(peer.stream).substr(0, length));
            peer.stream.erase(0, length);
            peer.scanner.reset();
        }
        return true;
    }

    void take(Peer& peer, std::string_view frame) {
        std::optional<protocol::Call> call = decoder_.decode(frame);
        if (!call) {
            std::abort(); // The library wrote what is no frame.
        }
        const std::lock_guard lock(mutex_);
        answer(peer, *call);
        calls_.push_back(std::move(*call));
        changed_.notify_all();
    }

    void answer(Peer& peer, const protocol::Call& call) {
        using protocol::Method;
        const std::int64_t reporterID = call.arguments.reporterID;
        if (call.method == Method::StopReportingSessionForID) {
            const auto held = peer.heldStarts.find(reporterID);
            if (held != peer.heldStarts.end()) {
                send(peer, held->second, {}, true);
                peer.heldStarts.erase(held);
            }
        }
        if (!call.messageID || call.method == Method::KillService) {
            return;
        }
        if (call.method == Method::StartReportingSessionForID) {
            peer.heldStarts[reporterID] = *call.messageID;
            return;
        }
        const auto given = answers_.find(call.method.value());
        if (given != answers_.end()) {
            send(peer, *call.messageID, given->second.first, given->second.second);
        } else {
            send(peer, *call.messageID, {}, true);
        }
    }

    static void send(const Peer& peer, std::uint32_t messageID, const MaybeError& error,
                     const Value& result) {
        std::string frame;
        protocol::appendAnswer(frame, messageID, error, result);
        ::send(peer.descriptor, frame.data(), frame.size(), MSG_NOSIGNAL);
    }

    const std::string path_;
    int listener_ = -1;
    int wake_ = -1;
    std::thread thread_;
    protocol::CallDecoder decoder_; // of the thread

    std::mutex mutex_;
    std::condition_variable changed_;
    Calls calls_;
    std::size_t ends_ = 0;
    std::map<protocol::Method, std::pair<MaybeError, Value>> answers_;
};

} // namespace halyard::testing
