#include "ClientSessions.h"

#include <string>
#include <utility>

namespace halyard::pipewire {

namespace {

// `key` is null in a list. Sets what the tracker's messages are made of.
void write(reporting::Dictionary& to, const char* key, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        break;
    case Value::Kind::Bool:
        to.set(key, value.boolValue());
        break;
    case Value::Kind::Int:
        to.set(key, value.integerValue());
        break;
    case Value::Kind::UInt:
        to.set(key, value.unsignedValue());
        break;
    case Value::Kind::Float:
        to.set(key, value.floatValue());
        break;
    case Value::Kind::Double:
        to.set(key, value.doubleValue());
        break;
    case Value::Kind::String:
        to.set(key, value.text());
        break;
    case Value::Kind::Date:
        to.setDate(key, value.date().seconds, value.date().nanoseconds);
        break;
    case Value::Kind::List:
        to.beginList(key);
        for (const Value& element : value.list()) {
            write(to, nullptr, element);
        }
        to.end();
        break;
    case Value::Kind::Dictionary:
        to.beginDictionary(key);
        for (const Dictionary::Entry& entry : value.dictionary()) {
            write(to, std::string(entry.key.text()).c_str(), entry.value);
        }
        to.end();
        break;
    }
}

} // namespace

reporting::Dictionary toReporting(const Dictionary& dictionary) {
    reporting::Dictionary result;
    for (const Dictionary::Entry& entry : dictionary) {
        write(result, std::string(entry.key.text()).c_str(), entry.value);
    }
    return result;
}

void ClientSessions::count(reporting::Result result) {
    if (result != HALYARD_OK) {
        ++refused_;
    }
}

void ClientSessions::open(std::int64_t reporterID, std::uint16_t serviceType,
                          const Dictionary& configuration) {
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
