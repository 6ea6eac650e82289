// The named service: an AF_UNIX stream socket that speaks MessagePack-RPC.
//
// Everything here runs on the one thread that runs the io_context, but for the
// answers and the charges, which come back from the queues' threads.
#pragma once

#include <asio/io_context.hpp>
#include <asio/local/stream_protocol.hpp>
#include <asio/steady_timer.hpp>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include "common/Result.h"
#include "linux/net/ClientBudgets.h"
#include "linux/net/Peer.h"
#include "linux/net/SocketConnection.h"
#include "linux/queues/Pressure.h"
#include "platform/Listener.h"

namespace halyard::linux_ {

class SocketListener final : public platform::Listener {
public:
    using Authorizer = std::function<PeerRights(const Peer&)>;

    // Takes over a listening socket. Borrows `context` and `pressure`.
    SocketListener(asio::io_context& context, Pressure& pressure, int listeningSocket,
                   Authorizer authorizer);
    ~SocketListener() override;

    void setDelegate(platform::ListenerDelegate* delegate) override { delegate_ = delegate; }
    // Runs the io_context: returns when that is stopped.
    void resume() override;

    // On the io_context's thread.
    void stopAccepting();
    // Leaves who connects from now on to whoever else holds the socket, and calls back
    // with true; or with false, and goes on, when somebody has come already. Later, never
    // from within. Requires that no earlier call is unanswered.
    void stopAcceptingUnlessSomebodyComes(std::function<void(bool stopped)> done);
    void onConnectionsChanged(std::function<void(std::size_t connections)> changed) {
        connectionsChanged_ = std::move(changed);
    }
    // Takes those who have come already; who comes later is refused. Requires that nobody
    // else holds the socket.
    void acceptTheLast();
    // Takes what was written up to now and closes each connection then. Calls back, never
    // from within, when there is none any more. Once, and nobody is accepted afterwards.
    void finishReading(std::function<void()> done);
    void closeAllConnections();
    // What was written to the connections and nobody has read.
    std::size_t unreadBytes();

    // Any thread. What one client process may make the daemon keep.
    void setLimits(const platform::ClientLimits& limits) { budgets_.setLimits(limits); }
    // What requests lead to may wait for a disk, so that this thread, which sees to signals
    // as well, is not lent for it.
    void keepThread() { shared_.lendsThread = false; }
    // Called on any thread when a client whose work had piled up may go on; it is read
    // from again by itself.
    void onClientRelieved(std::function<void()> relieved);

    // Any thread.
    std::vector<std::int32_t> connectedProcesses() const { return shared_.processes.pids(); }
    const ListenerCounters& counters() const { return shared_.counters; }

private:
    void accept();
    void accepted(asio::local::stream_protocol::socket socket);
    void acceptFailed(const asio::error_code& error);
    void answerLeaver(bool stopped);
    void refuse(const Peer& peer);
    void refuseAnother(const Peer& peer);
    void resumeReading();
    void tellConnections(std::size_t connections);

    asio::io_context& context_;
    asio::local::stream_protocol::acceptor acceptor_;
    asio::steady_timer retry_;
    const Authorizer authorizer_;
    platform::ListenerDelegate* delegate_ = nullptr;
    ClientBudgets budgets_;
    ListenerShared shared_;
    std::optional<std::uint32_t> refusedUid_; // The episode that has been logged.
    std::optional<std::int32_t> crowdedPid_;  // The same for too many of a process.
    bool acceptFailureLogged_ = false;
    std::function<void(bool)> leaver_;
    std::function<void(std::size_t)> connectionsChanged_; // may be none
    std::function<void()> finished_;                      // Once no connection is left.
};

// A listening socket at `path` (mode 0666), replacing the leftover of a daemon
// that is gone; else what is in the way.
Result<int> listenAt(const std::string& path);

// The socket that a service manager passed under `name`; it need not have.
std::optional<int> inheritedSocket(std::string_view name);

} // namespace halyard::linux_
