#include "client/Replies.h"

#include <algorithm>
#include <limits>

namespace halyard::client {
namespace {

constexpr std::int64_t kUnknownService = HALYARD_SERVICE_UNKNOWN;

const char* textOf(std::int64_t code) {
    switch (code) {
    case HALYARD_ERROR_CONNECTION_LOST:
        return "the connection broke before the answer came";
    case HALYARD_ERROR_DISCARDED:
        return "the request was given up unsent";
    case HALYARD_ERROR_CLOSED:
        return "the client was destroyed before the answer came";
    default:
        return "the daemon's answer is no result of this request";
    }
}

void call(const Callback& callback, const halyard_error* error, const Value& result) {
    switch (callback.shape) {
    case Callback::Shape::None:
        return;
    case Callback::Shape::Done:
        return callback.done(callback.context, error);
    case Callback::Shape::ServiceType: {
        const std::int64_t type = error != nullptr ? kUnknownService : result.integerValue();
        return callback.serviceType(callback.context, error, static_cast<std::uint16_t>(type));
    }
    case Callback::Shape::Reporter: {
        const Dictionary answer = result.dictionary();
        const std::int64_t type =
            error != nullptr ? kUnknownService : answer["serviceType"].integerValue();
        return callback.reporter(callback.context, error, answer["reporterID"].integerValue(),
                                 static_cast<std::uint16_t>(type));
    }
    case Callback::Shape::Reporters: {
        std::vector<std::int64_t> ids;
        for (const Value& id : result.list()) {
            ids.push_back(id.integerValue());
        }
        return callback.reporters(callback.context, error, ids.data(), ids.size());
    }
    }
}

bool isServiceType(const Value& value) {
    return value.kind() == Value::Kind::Int && value.integerValue() >= 0 &&
           value.integerValue() <= std::numeric_limits<std::uint16_t>::max();
}

bool isListOfIDs(const Value& value) {
    const List list = value.list();
    return value.isList() && std::all_of(list.begin(), list.end(), [](const Value& item) {
               return item.kind() == Value::Kind::Int;
           });
}

bool isResultFor(Callback::Shape shape, const Value& result) {
    switch (shape) {
    case Callback::Shape::ServiceType:
        return isServiceType(result);
    case Callback::Shape::Reporter:
        return isServiceType(result.dictionary()["serviceType"]) &&
               result.dictionary()["reporterID"].kind() == Value::Kind::Int;
    case Callback::Shape::Reporters:
        return isListOfIDs(result);
    default:
        return true;
    }
}

void succeed(const Callback& callback, const Value& result) {
    if (isResultFor(callback.shape, result)) {
        call(callback, nullptr, result);
    } else {
        fail(callback, HALYARD_ERROR_BAD_ANSWER);
    }
}

} // namespace

void fail(const Callback& callback, std::int64_t code) noexcept {
    const halyard_error error{HALYARD_ERROR_DOMAIN, code, textOf(code)};
    call(callback, &error, Value());
}

void Replies::add(std::uint32_t messageID, const Callback& callback) {
    waiting_[messageID] = {callback, 0};
}

void Replies::hold(std::uint32_t messageID, const Callback& callback, std::int64_t reporterID) {
    waiting_[messageID] = {callback, reporterID};
    held_[reporterID] = messageID;
}

void Replies::letGo(std::int64_t reporterID) {
    const auto held = held_.find(reporterID);
    if (held != held_.end()) {
        waiting_[held->second].heldFor = 0;
        held_.erase(held);
    }
}

void Replies::deliver(const protocol::Answer& answer) {
    const auto found = waiting_.find(answer.messageID);
    if (found == waiting_.end()) {
        return;
    }
    const Waiting waiting = found->second;
    waiting_.erase(found);
    if (waiting.heldFor != 0) {
        held_.erase(waiting.heldFor);
    }
    if (!answer.error) {
        return succeed(waiting.callback, answer.result);
    }
    const halyard_error error{answer.error->domain.c_str(), answer.error->code,
                              answer.error->message.c_str()};
    call(waiting.callback, &error, Value());
}

std::vector<std::pair<std::int64_t, Callback>> Replies::takeHeld() {
    std::vector<std::pair<std::int64_t, Callback>> result;
    for (const auto& [reporterID, messageID] : held_) {
        result.emplace_back(reporterID, waiting_[messageID].callback);
        waiting_.erase(messageID);
    }
    held_.clear();
    return result;
}

void Replies::failAll(std::int64_t code) {
    held_.clear();
    for (const auto& [messageID, waiting] : std::exchange(waiting_, {})) {
        fail(waiting.callback, code);
    }
}

} // namespace halyard::client
