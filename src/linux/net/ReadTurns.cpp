#include "linux/net/ReadTurns.h"

#include <asio/post.hpp>
#include <utility>

#include "linux/net/SocketConnection.h"

namespace halyard::linux_ {

void ReadTurns::ask(std::shared_ptr<SocketConnection> connection) {
    const Client client = connection->budget().get();
    auto& connections = waiting_[client];
    if (connections.empty()) {
        turns_.push_back(client);
    }
    connections.push_back(std::move(connection));
    schedule();
}

void ReadTurns::schedule() {
    if (!turns_.empty() && !std::exchange(scheduled_, true)) {
        asio::post(context_, [this] { take(); });
    }
}

void ReadTurns::take() {
    scheduled_ = false;
    const Client client = turns_.front();
    turns_.pop_front();
    const auto found = waiting_.find(client);
    const std::shared_ptr<SocketConnection> next = std::move(found->second.front());
    found->second.pop_front();
    if (found->second.empty()) {
        waiting_.erase(found);
    } else {
        turns_.push_back(client);
    }
    schedule();
    next->readAvailable();
}

} // namespace halyard::linux_
