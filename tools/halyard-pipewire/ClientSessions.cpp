#include "ClientSessions.h"

#include <utility>
#include <variant>

namespace halyard::pipewire {

namespace {

void write(reporting::Dictionary& to, const Contents& contents);

// Writes one fact, whatever it holds.
struct Writer {
    reporting::Dictionary& to;
    const char* key;

    template <class Plain> void operator()(const Plain& fact) const { to.set(key, fact); }
    void operator()(const Nested& fact) const {
        for (const Contents& inner : fact.inner) {
            to.beginDictionary(key);
            write(to, inner);
            to.end();
        }
    }
    void operator()(const Dictionaries& facts) const {
        to.beginList(key);
        for (const Contents& inner : facts) {
            to.beginDictionary();
            write(to, inner);
            to.end();
        }
        to.end();
    }
};

void write(reporting::Dictionary& to, const Contents& contents) {
    for (const auto& entry : contents) {
        std::visit(Writer{to, entry.key.c_str()}, entry.value);
    }
}

reporting::Dictionary toReporting(const Contents& contents) {
    reporting::Dictionary result;
    write(result, contents);
    return result;
}

} // namespace

void ClientSessions::count(reporting::Result result) {
    if (result != HALYARD_OK) {
        ++refused_;
    }
}

void ClientSessions::open(std::int64_t reporterID, std::uint16_t serviceType,
                          const Contents& configuration) {
    reporting::Session session = client_.createSession(reporterID);
    if (!session) {
        ++refused_;
        return;
    }
    count(session.setServiceType(serviceType));
    count(session.setConfiguration(toReporting(configuration)));
    count(session.start());
    sessions_.insert_or_assign(reporterID, std::move(session));
}

void ClientSessions::send(std::int64_t reporterID, const Message& message) {
    const auto found = sessions_.find(reporterID);
    if (found == sessions_.end()) {
        ++refused_; // its session could not be made
        return;
    }
    count(found->second.send(toReporting(message.contents), message.category, message.type));
}

// An explicit stop first: the daemon takes a session that is only destroyed for
// one that still runs. It is to be answered, which the end of the client waits
// for: so nothing is left unread in the socket when this process is gone.
void ClientSessions::close(std::int64_t reporterID) {
    const auto found = sessions_.find(reporterID);
    if (found != sessions_.end()) {
        count(found->second.stop([](const reporting::Failure*) {}));
        sessions_.erase(found);
    }
}

} // namespace halyard::pipewire
