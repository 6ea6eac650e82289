// The named-service listener: connections, and the requests that come in on them.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/ClientBudget.h"
#include "protocol/Request.h"

namespace halyard::platform {

// What a connection exports to its peer.
class ExportedObject {
public:
    virtual ~ExportedObject() = default;
    // Called on a delivery thread, in the order in which the peer sent. The
    // arguments have been checked against the method's table.
    virtual void handle(protocol::Request request) = 0;
};

// One peer. The handlers run on a delivery thread, each once at most; a broken
// connection is interrupted first and invalidated after.
class Connection {
public:
    virtual ~Connection() = default;
    virtual std::int32_t processIdentifier() const = 0;
    virtual std::string description() const = 0;
    // What the peer's process may make the daemon keep. Never null.
    virtual ClientBudgetPtr budget() const = 0;
    virtual void setExportedObject(std::shared_ptr<ExportedObject> object) = 0;
    virtual void setInterruptionHandler(std::function<void()> handler) = 0;
    virtual void setInvalidationHandler(std::function<void()> handler) = 0;
    // Nothing is read from the peer before this.
    virtual void resume() = 0;
};

class ListenerDelegate {
public:
    virtual ~ListenerDelegate() = default;
    // On a delivery thread. False closes the connection.
    virtual bool shouldAcceptNewConnection(const std::shared_ptr<Connection>& connection) = 0;
};

class Listener {
public:
    virtual ~Listener() = default;
    // Borrowed.
    virtual void setDelegate(ListenerDelegate* delegate) = 0;
    // Serves until the process is asked to end.
    virtual void resume() = 0;
};

} // namespace halyard::platform
