// The client's sessions as the daemon knows them, to make them again after the
// daemon has been away.
//
// Only what has been written to the daemon (or given up, see Worker) is applied
// here; what is still queued will follow by itself. So at any moment this table
// and the queue together are the state that the caller asked for.
//
// Belongs to the client's thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "client/Record.h"
#include "common/Value.h"

namespace halyard::client {

class SessionTable {
public:
    // Applies one request, a message being none of them. True when it starts a
    // session that was not started: the answer will be held then.
    bool apply(const Record& record);

    // The session was started, but the connection that would have answered is
    // gone: `stopped` goes with the next start. Fails it when the session is no
    // longer started.
    void keepStartReply(std::int64_t reporterID, const Callback& stopped);
    // The reply kept for a session that is about to be stopped, if any.
    Callback takeStartReply(std::int64_t reporterID);
    std::vector<Callback> takeAllStartReplies();

    struct Session {
        std::int64_t reporterID = 0;
        std::optional<std::uint16_t> serviceType;
        Dictionary configuration;
        bool started = false;
        Callback stopped; // Not at the daemon yet.
    };
    // In the order in which they were made.
    std::map<std::uint64_t, Session>& sessions() { return sessions_; }
    void erase(std::int64_t reporterID);

private:
    Session* find(std::int64_t reporterID);
    void create(std::int64_t reporterID);

    std::map<std::uint64_t, Session> sessions_; // by order of creation
    std::unordered_map<std::int64_t, std::uint64_t> orders_;
    std::uint64_t nextOrder_ = 0;
};

// Appends the calls that make `session` anew, all but its start.
void appendRecreation(std::string& out, const SessionTable::Session& session);

} // namespace halyard::client
