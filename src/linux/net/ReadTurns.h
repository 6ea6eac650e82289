// Reads from clients in turns: one read of each process that has something to read,
// round and round, so that one with thousands of connections is read from no more often
// than one with a single one.
//
// On the io_context's thread.
#pragma once

#include <asio/io_context.hpp>
#include <deque>
#include <memory>
#include <unordered_map>

namespace halyard::linux_ {

class SocketConnection;

class ReadTurns {
public:
    // Borrows `context`.
    explicit ReadTurns(asio::io_context& context) : context_(context) {}

    // Has the connection read once when it is its process's turn.
    void ask(std::shared_ptr<SocketConnection> connection);

private:
    using Client = const void*;

    void schedule();
    void take();

    asio::io_context& context_;
    std::unordered_map<Client, std::deque<std::shared_ptr<SocketConnection>>> waiting_;
    std::deque<Client> turns_;
    bool scheduled_ = false;
};

} // namespace halyard::linux_
