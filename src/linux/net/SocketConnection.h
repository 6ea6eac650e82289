// One client's connection.
//
// Reads many frames at once into a buffer that all connections share, hands the
// requests over, and keeps a buffer of its own only for a frame that has not
// come in whole, so an idle connection is small. It stops reading
//  - while its requests that are not processed number more than 1,024 or measure
//    more than 4 MiB,
//  - while the peer leaves answers lying, and closes when they pass 4 MiB,
//  - while more of its process's work is on its way than one client may have,
//  - while the whole daemon is under pressure.
// Clients are read in turns (see ReadTurns), however many connections each has.
//
// A peer that takes no more answers has usually left; what it wrote before is
// still read and done. One that breaks the protocol loses this connection and
// nothing else.
#pragma once

#include <asio/io_context.hpp>
#include <asio/local/stream_protocol.hpp>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_set>

#include "common/Mutex.h"
#include "linux/net/Peer.h"
#include "linux/net/ProcessList.h"
#include "linux/net/ReadTurns.h"
#include "linux/queues/Charge.h"
#include "linux/queues/Pressure.h"
#include "platform/Listener.h"
#include "protocol/Wire.h"

namespace halyard::linux_ {

// Written on the io_context's thread, read on any.
struct ListenerCounters {
    std::atomic<std::uint64_t> accepted{0};
    std::atomic<std::uint64_t> refused{0};
    std::atomic<std::uint64_t> broken{0}; // closed for what the peer sent or left lying
    std::atomic<std::uint64_t> requests{0};
    std::atomic<std::uint64_t> badRequests{0}; // answered with an IPC error
    std::atomic<std::uint64_t> bytesRead{0};
};

class SocketConnection;
class WakeUpScope;

// What the connections of one listener share; on the io_context's thread.
struct ListenerShared {
    ListenerShared(Pressure& p, asio::io_context& c)
        : pressure(p), context(c), buffer(kReadSize, '\0'), turns(c) {}

    static constexpr std::size_t kReadSize = 64 * 1024;

    Pressure& pressure;
    asio::io_context& context;
    bool lendsThread = true;                   // for what single requests lead to
    const SocketConnection* reading = nullptr; // the one whose requests are being taken
    std::string buffer;
    protocol::CallDecoder decoder;
    std::unordered_set<std::shared_ptr<SocketConnection>> connections;
    std::function<void(std::size_t connections)> connectionsChanged; // may be none
    ListenerCounters counters;
    ReadTurns turns;
    ProcessList processes; // of the connections; any thread

    void add(const std::shared_ptr<SocketConnection>& connection, std::int32_t pid);
    void remove(const std::shared_ptr<SocketConnection>& connection, std::int32_t pid);
};

class SocketConnection final : public platform::Connection,
                               public std::enable_shared_from_this<SocketConnection> {
public:
    static constexpr std::size_t kMaxUnprocessedRequests = 1024;
    static constexpr std::size_t kMaxUnprocessedBytes = 4 * 1024 * 1024;
    static constexpr std::size_t kMaxUnsentBytes = 4 * 1024 * 1024;
    // More unsent bytes than this, and the peer is not read from.
    static constexpr std::size_t kUnsentPause = 64 * 1024;

    // Requires that the budget has taken the connection.
    SocketConnection(asio::local::stream_protocol::socket socket, Peer peer, PeerRights rights,
                     platform::ClientBudgetPtr budget, ListenerShared& shared);
    ~SocketConnection() override;

    std::int32_t processIdentifier() const override { return peer_.pid; }
    std::string description() const override;
    platform::ClientBudgetPtr budget() const override { return budget_; }
    void setExportedObject(std::shared_ptr<platform::ExportedObject> object) override;
    void setInterruptionHandler(std::function<void()> handler) override;
    void setInvalidationHandler(std::function<void()> handler) override;
    void resume() override;

    // On the io_context's thread.
    void close();
    // Reads what the peer has written up to now, then closes; what it writes later fails.
    void finish();
    // What it has written and nobody has read.
    std::size_t unreadBytes();
    void readIfAllowed();
    void readAvailable();

    // Any thread.
    void send(std::string_view bytes) HY_EXCLUDES(outMutex_);
    void workDone(std::size_t requests, std::size_t bytes);

private:
    class ReadCharge;
    class SocketResponder;
    enum class Ending { Closed, Broken };
    enum class Written { All, Some, Refused };

    bool mayRead() const;
    // Whether it may not; then somebody calls readIfAllowed() once it may again.
    bool pausesReading();
    void waitReadable();
    // Takes what is in the shared buffer's first bytes.
    void takeChunk(std::string_view chunk);
    // Whether the calling thread is taking this connection's requests.
    bool isReadHere() const;
    // Breaks off when the budget has no room for a frame that has not come in whole.
    void chargePending();
    // Takes the frames at the front of `stream`; returns how many bytes they had.
    std::size_t takeFrames(std::string_view stream);
    bool takeFrame(std::string_view frame, std::size_t memory,
                   const std::shared_ptr<ReadCharge>& charge, WakeUpScope& wakeUps);
    void refuseCall(const protocol::Call& call, MaybeError error);
    void scheduleWriting();
    Written writeOnce() HY_EXCLUDES(outMutex_);
    void writeSome();
    void stopAnswering() HY_EXCLUDES(outMutex_);
    void closeUnlessLeft(bool complete);
    void breakOff(std::string_view why);
    void end(Ending ending);

    asio::local::stream_protocol::socket socket_;
    const Peer peer_;
    const PeerRights rights_;
    const platform::ClientBudgetPtr budget_;
    platform::Allotment ownBytes_;
    ListenerShared& shared_;

    std::shared_ptr<platform::ExportedObject> exported_;
    std::function<void()> interruptionHandler_;
    std::function<void()> invalidationHandler_;

    protocol::FrameScanner scanner_;
    std::string pending_; // The bytes of frames that wait to be taken.
    platform::Allotment pendingBytes_;
    bool framesWait_ = false;  // They do not wait for more bytes.
    bool answersWait_ = false; // for the end of the read that they are made in
    bool waiting_ = false;
    bool ended_ = false;
    bool peerFinished_ = false;
    bool finishing_ = false;
    Ending ending_ = Ending::Closed; // Once all is read that the peer sent.

    std::atomic<std::size_t> unprocessedRequests_{0};
    std::atomic<std::size_t> unprocessedBytes_{0};
    std::atomic<bool> paused_{false};

    Mutex outMutex_;
    std::string out_ HY_GUARDED_BY(outMutex_);
    platform::Allotment outBytes_ HY_GUARDED_BY(outMutex_);
    bool writeScheduled_ HY_GUARDED_BY(outMutex_) = false;
    bool deaf_ HY_GUARDED_BY(outMutex_) = false; // The peer takes no more answers.
    std::atomic<std::size_t> unsentBytes_{0};
};

} // namespace halyard::linux_
