#include <fmt/format.h>

#include "common/Utf8.h"
#include "protocol/Methods.h"
#include "protocol/ValueDecoder.h"
#include "protocol/Wire.h"

namespace halyard::protocol {
namespace {

constexpr std::uint64_t kRequestType = 0;
constexpr std::uint64_t kNotificationType = 2;
constexpr std::size_t kRequestLength = 4;
constexpr std::size_t kNotificationLength = 3;
// Containers around an argument: the frame and its params.
constexpr int kArgumentDepth = 2;
// A message gets its tag in place, without moving its entries.
constexpr std::size_t kSpareEntries = 1;
// Of a name that comes from outside, in an answer.
constexpr std::size_t kMaxShownBytes = 64;

Error ipcError(IpcErrorCode code, std::string message) {
    return {std::string(kIpcErrorDomain), static_cast<std::int64_t>(code), std::move(message)};
}

// Printable, well-formed and short, whatever came.
std::string shown(std::string_view text) {
    const bool isLong = text.size() > kMaxShownBytes;
    std::string result = "\"";
    for (const char c : replaceInvalidUtf8(text.substr(0, kMaxShownBytes))) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            fmt::format_to(std::back_inserter(result), "\\x{:02x}", static_cast<unsigned>(c));
        } else if (c == '"' || c == '\\') {
            result += '\\';
            result += c;
        } else {
            result += c;
        }
    }
    return result + (isLong ? "...\"" : "\"");
}

// Takes the arguments of one call in the order of its method's entry. Each
// take... returns false when the argument is not what the table asks for and
// leaves the reason in `complaint_`.
class ArgumentReader {
public:
    // Configurations are merged, and so kept by their parts; messages are not.
    ArgumentReader(ValueDecoder& decoder, Arguments& out, Method method)
        : decoder_(decoder), out_(out), isMessage_(method == Method::SendMessage) {}

    bool take(Argument argument);
    // "is nil, not a string"
    const std::string& complaint() const { return complaint_; }

private:
    bool takeDictionary(const Token& token);
    bool takeName(const Token& token);
    bool takeReporterIDs(const Token& token);
    template <class T> bool takeInteger(const Token& token, T& out);
    bool wrongType(const Token& token);

    ValueDecoder& decoder_;
    Arguments& out_;
    const bool isMessage_;
    Argument current_ = Argument::ReporterID;
    std::string complaint_;
};

bool ArgumentReader::take(Argument argument) {
    current_ = argument;
    const Token token = decoder_.next();
    switch (argument) {
    case Argument::ReporterID:
        return takeInteger(token, out_.reporterID);
    case Argument::ServiceType:
        return takeInteger(token, out_.serviceType);
    case Argument::Dictionary:
        return takeDictionary(token);
    case Argument::Category:
        return takeInteger(token, out_.category);
    case Argument::Type:
        return takeInteger(token, out_.type);
    case Argument::ReporterIDList:
        return takeReporterIDs(token);
    case Argument::Name:
        return takeName(token);
    }
    return false;
}

bool ArgumentReader::wrongType(const Token& token) {
    complaint_ = fmt::format("is {}, not {}", kindName(token), argumentType(current_));
    return false;
}

template <class T> bool ArgumentReader::takeInteger(const Token& token, T& out) {
    const auto integer = Integer::from(token);
    if (!integer) {
        return wrongType(token);
    }
    const auto value = integer->as<T>();
    if (!value) {
        complaint_ =
            fmt::format("is {}, out of range: not {}", integer->text(), argumentType(current_));
        return false;
    }
    out = *value;
    return true;
}

bool ArgumentReader::takeDictionary(const Token& token) {
    if (token.family != Family::Map) {
        return wrongType(token);
    }
    out_.dictionary = isMessage_ ? decoder_.message(token, kArgumentDepth, kSpareEntries)
                                 : decoder_.dictionary(token, kArgumentDepth);
    if (decoder_.problem() != ValueDecoder::Problem::None) {
        complaint_ = "holds " + decoder_.problemText();
        return false;
    }
    return true;
}

bool ArgumentReader::takeName(const Token& token) {
    if (token.family != Family::Text) {
        return wrongType(token);
    }
    out_.name = token.bytes();
    return true;
}

bool ArgumentReader::takeReporterIDs(const Token& token) {
    if (token.family == Family::Nil) {
        return true;
    }
    if (token.family != Family::Array) {
        return wrongType(token);
    }
    ReporterIDs& list = out_.reporterIDs.emplace();
    list.reserve(token.size);
    for (std::size_t i = 0; i < token.size; ++i) {
        const Token element = decoder_.next();
        const auto integer = Integer::from(element);
        const auto value = integer ? integer->as<std::int64_t>() : std::nullopt;
        if (!value) {
            complaint_ = fmt::format("holds {} at index {}, not {}",
                                     integer ? integer->text() : kindName(element), i,
                                     argumentType(Argument::ReporterID));
            return false;
        }
        list.push_back(*value);
    }
    return true;
}

// Fills in the method and its arguments, or the error.
void decodeParams(ValueDecoder& decoder, std::string_view name, std::size_t count, Call& call) {
    const MethodEntry* entry = findMethod(name);
    if (entry == nullptr) {
        call.error = ipcError(IpcErrorCode::UnknownMethod, "unknown method " + shown(name));
        return;
    }
    const auto fail = [&](std::size_t index, std::string_view complaint) {
        call.arguments = {};
        call.error = ipcError(IpcErrorCode::BadArgument,
                              fmt::format("argument {} \"{}\" of {} {}", index + 1,
                                          argumentName(entry->list[index]), name, complaint));
    };
    if (count < entry->count) {
        return fail(count, "is missing");
    }
    if (count > entry->count) {
        call.error = ipcError(IpcErrorCode::BadArgument,
                              fmt::format("argument {} of {} is extra: it takes {}",
                                          entry->count + 1, name, entry->count));
        return;
    }
    ArgumentReader reader(decoder, call.arguments, entry->method);
    for (std::size_t i = 0; i < count; ++i) {
        if (!reader.take(entry->list[i])) {
            return fail(i, reader.complaint());
        }
    }
    call.method = entry->method;
}

template <class T> std::optional<T> integerOf(const Token& token) {
    const auto integer = Integer::from(token);
    return integer ? integer->as<T>() : std::nullopt;
}

} // namespace

std::optional<Call> CallDecoder::decode(std::string_view frame) {
    ValueDecoder decoder(frame, &keys_);
    const Token whole = decoder.next();
    if (whole.family != Family::Array) {
        return std::nullopt;
    }
    const auto type = whole.size > 0 ? integerOf<std::uint64_t>(decoder.next()) : std::nullopt;
    const bool isRequest = type == kRequestType && whole.size == kRequestLength;
    if (!isRequest && !(type == kNotificationType && whole.size == kNotificationLength)) {
        return std::nullopt;
    }
    std::optional<Call> call(std::in_place);
    if (isRequest) {
        call->messageID = integerOf<std::uint32_t>(decoder.next());
        if (!call->messageID) {
            return std::nullopt;
        }
    }
    const Token method = decoder.next();
    const Token params = decoder.next();
    if (method.family != Family::Text || params.family != Family::Array) {
        return std::nullopt;
    }
    decodeParams(decoder, method.bytes(), params.size, *call);
    return call;
}

} // namespace halyard::protocol
