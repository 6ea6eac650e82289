#include "client/Frames.h"

#include "protocol/Wire.h"

namespace halyard::client {
namespace {

using protocol::Method;

constexpr int kRequestType = 0;
constexpr int kNotificationType = 2;

void appendHead(std::string& out, std::optional<std::uint32_t> messageID, Method method,
                std::size_t argumentCount) {
    protocol::appendArray(out, messageID ? 4 : 3);
    protocol::appendValue(out, messageID ? kRequestType : kNotificationType);
    if (messageID) {
        protocol::appendValue(out, *messageID);
    }
    protocol::appendText(out, protocol::methodName(method));
    protocol::appendArray(out, argumentCount);
}

void appendDictionary(std::string& out, const Record& record) {
    protocol::appendMap(out, record.entryCount);
    out += record.body();
}

void appendIDs(std::string& out, const Record& record) {
    if (record.broadcast) {
        protocol::appendValue(out, Value());
        return;
    }
    protocol::appendArray(out, record.idCount);
    for (std::uint32_t i = 0; i < record.idCount; ++i) {
        protocol::appendValue(out, record.idAt(i));
    }
}

} // namespace

void appendSessionCall(std::string& out, std::optional<std::uint32_t> messageID, Method method,
                       std::int64_t reporterID) {
    protocol::Arguments arguments;
    arguments.reporterID = reporterID;
    protocol::appendCall(out, messageID, method, arguments);
}

void appendFrame(std::string& out, std::optional<std::uint32_t> messageID, const Record& record) {
    switch (record.method) {
    case Method::SendMessage:
        appendHead(out, messageID, record.method, 4);
        appendDictionary(out, record);
        protocol::appendValue(out, record.category);
        protocol::appendValue(out, record.type);
        appendIDs(out, record);
        return;
    case Method::SetConfiguration:
        appendHead(out, messageID, record.method, 2);
        appendDictionary(out, record);
        protocol::appendValue(out, record.reporterID);
        return;
    default: {
        protocol::Arguments arguments;
        arguments.reporterID = record.reporterID;
        arguments.serviceType = record.type;
        protocol::appendCall(out, messageID, record.method, arguments);
    }
    }
}

Dictionary dictionaryOf(const Record& record) {
    std::string frame;
    appendFrame(frame, std::nullopt, record);
    protocol::CallDecoder decoder;
    const std::optional<protocol::Call> call = decoder.decode(frame);
    return call ? call->arguments.dictionary : Dictionary();
}

} // namespace halyard::client
