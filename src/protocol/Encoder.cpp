#include <bit>
#include <type_traits>

#include "common/Description.h"
#include "protocol/Methods.h"
#include "protocol/Wire.h"

namespace halyard::protocol {
namespace {

constexpr unsigned kRequestType = 0;
constexpr unsigned kAnswerType = 1;
constexpr unsigned kNotificationType = 2;

void appendByte(std::string& out, unsigned byte) {
    out += static_cast<char>(static_cast<unsigned char>(byte));
}

template <class Unsigned> void appendBig(std::string& out, Unsigned value) {
    static_assert(std::is_unsigned_v<Unsigned>);
    char bytes[sizeof(Unsigned)];
    for (std::size_t i = 0; i < sizeof(Unsigned); ++i) {
        bytes[i] = static_cast<char>(
            static_cast<unsigned char>(value >> (8 * (sizeof(Unsigned) - 1 - i))));
    }
    out.append(bytes, sizeof(bytes));
}

template <class Unsigned> void appendHead(std::string& out, unsigned byte, Unsigned value) {
    appendByte(out, byte);
    appendBig(out, value);
}

void appendUnsigned(std::string& out, std::uint64_t value) {
    if (value <= 0x7F) {
        appendByte(out, static_cast<unsigned>(value));
    } else if (value <= 0xFF) {
        appendHead(out, 0xCC, static_cast<std::uint8_t>(value));
    } else if (value <= 0xFFFF) {
        appendHead(out, 0xCD, static_cast<std::uint16_t>(value));
    } else if (value <= 0xFFFFFFFF) {
        appendHead(out, 0xCE, static_cast<std::uint32_t>(value));
    } else {
        appendHead(out, 0xCF, value);
    }
}

void appendSigned(std::string& out, std::int64_t value) {
    if (value >= 0) {
        appendUnsigned(out, static_cast<std::uint64_t>(value));
    } else if (value >= -32) {
        appendByte(out, static_cast<unsigned>(value) & 0xFFU);
    } else if (value >= std::numeric_limits<std::int8_t>::min()) {
        appendHead(out, 0xD0, static_cast<std::uint8_t>(value));
    } else if (value >= std::numeric_limits<std::int16_t>::min()) {
        appendHead(out, 0xD1, static_cast<std::uint16_t>(value));
    } else if (value >= std::numeric_limits<std::int32_t>::min()) {
        appendHead(out, 0xD2, static_cast<std::uint32_t>(value));
    } else {
        appendHead(out, 0xD3, static_cast<std::uint64_t>(value));
    }
}

// `small` is the head of up to 15 elements, `wide` that of a 16-bit count; the
// head of a 32-bit one follows it.
void appendContainer(std::string& out, unsigned small, unsigned wide, std::size_t size) {
    if (size <= 15) {
        appendByte(out, small | static_cast<unsigned>(size));
    } else if (size <= 0xFFFF) {
        appendHead(out, wide, static_cast<std::uint16_t>(size));
    } else {
        appendHead(out, wide + 1, static_cast<std::uint32_t>(size));
    }
}

} // namespace

void appendText(std::string& out, std::string_view text) {
    if (text.size() <= 31) {
        appendByte(out, 0xA0U | static_cast<unsigned>(text.size()));
    } else if (text.size() <= 0xFF) {
        appendHead(out, 0xD9, static_cast<std::uint8_t>(text.size()));
    } else if (text.size() <= 0xFFFF) {
        appendHead(out, 0xDA, static_cast<std::uint16_t>(text.size()));
    } else {
        appendHead(out, 0xDB, static_cast<std::uint32_t>(text.size()));
    }
    out += text;
}

void appendArray(std::string& out, std::size_t size) {
    appendContainer(out, 0x90, 0xDC, size);
}

void appendMap(std::string& out, std::size_t size) {
    appendContainer(out, 0x80, 0xDE, size);
}

namespace {

// The smallest of the three timestamps that holds the date.
void appendDate(std::string& out, Date date) {
    constexpr unsigned kTimestampType = 0xFF;
    const auto seconds = static_cast<std::uint64_t>(date.seconds);
    if ((seconds >> 34U) != 0) { // Negative ones too.
        appendHead(out, 0xC7, std::uint8_t{12});
        appendByte(out, kTimestampType);
        appendBig(out, date.nanoseconds);
        appendBig(out, seconds);
    } else if (date.nanoseconds != 0 || seconds > 0xFFFFFFFF) {
        appendByte(out, 0xD7);
        appendByte(out, kTimestampType);
        appendBig(out, std::uint64_t{date.nanoseconds} << 34U | seconds);
    } else {
        appendByte(out, 0xD6);
        appendByte(out, kTimestampType);
        appendBig(out, static_cast<std::uint32_t>(seconds));
    }
}

void appendList(std::string& out, const List& list) {
    appendArray(out, list.size());
    for (const Value& item : list) {
        appendValue(out, item);
    }
}

void appendDictionary(std::string& out, const Dictionary& dictionary) {
    appendMap(out, dictionary.size());
    for (const Dictionary::Entry& entry : dictionary) {
        appendText(out, entry.key.text());
        appendValue(out, entry.value);
    }
}

void appendError(std::string& out, const MaybeError& error) {
    if (!error) {
        appendValue(out, Value());
        return;
    }
    appendMap(out, 3);
    appendText(out, "domain");
    appendText(out, error->domain);
    appendText(out, "code");
    appendSigned(out, error->code);
    appendText(out, "message");
    appendText(out, error->message);
}

void appendReporterIDs(std::string& out, const std::optional<ReporterIDs>& list) {
    if (!list) {
        appendValue(out, Value());
        return;
    }
    appendArray(out, list->size());
    for (const std::int64_t reporterID : *list) {
        appendSigned(out, reporterID);
    }
}

void appendArgument(std::string& out, Argument argument, const Arguments& values) {
    switch (argument) {
    case Argument::ReporterID:
        return appendSigned(out, values.reporterID);
    case Argument::ServiceType:
        return appendUnsigned(out, values.serviceType);
    case Argument::Dictionary:
        return appendDictionary(out, values.dictionary);
    case Argument::Category:
        return appendUnsigned(out, values.category);
    case Argument::Type:
        return appendUnsigned(out, values.type);
    case Argument::ReporterIDList:
        return appendReporterIDs(out, values.reporterIDs);
    case Argument::Name:
        return appendText(out, values.name);
    }
}

} // namespace

void appendValue(std::string& out, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        return appendByte(out, 0xC0);
    case Value::Kind::Bool:
        return appendByte(out, value.boolValue() ? 0xC3 : 0xC2);
    case Value::Kind::Int:
        return appendSigned(out, value.integerValue());
    case Value::Kind::UInt:
        return appendUnsigned(out, value.unsignedValue());
    case Value::Kind::Float:
        return appendHead(out, 0xCA, std::bit_cast<std::uint32_t>(value.floatValue()));
    case Value::Kind::Double:
        return appendHead(out, 0xCB, std::bit_cast<std::uint64_t>(value.doubleValue()));
    case Value::Kind::String:
        return appendText(out, value.text());
    case Value::Kind::Date:
        return appendDate(out, value.date());
    case Value::Kind::List:
        return appendList(out, value.list());
    case Value::Kind::Dictionary:
        return appendDictionary(out, value.dictionary());
    }
}

void appendAnswer(std::string& out, std::uint32_t messageID, const MaybeError& error,
                  const Value& result) {
    appendArray(out, 4);
    appendUnsigned(out, kAnswerType);
    appendUnsigned(out, messageID);
    appendError(out, error);
    appendValue(out, result);
}

void appendCall(std::string& out, std::optional<std::uint32_t> messageID, Method method,
                const Arguments& arguments) {
    const MethodEntry& entry = methodEntry(method);
    appendArray(out, messageID ? 4 : 3);
    appendUnsigned(out, messageID ? kRequestType : kNotificationType);
    if (messageID) {
        appendUnsigned(out, *messageID);
    }
    appendText(out, entry.name);
    appendArray(out, entry.count);
    for (const Argument argument : entry.arguments()) {
        appendArgument(out, argument, arguments);
    }
}

} // namespace halyard::protocol
