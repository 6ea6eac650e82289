#include "common/Description.h"
#include "protocol/ValueDecoder.h"
#include "protocol/Wire.h"

namespace halyard::protocol {
namespace {

constexpr std::uint64_t kAnswerType = 1;
constexpr std::size_t kAnswerLength = 4;
// Containers around an answer's error and result: the frame.
constexpr int kPartDepth = 1;

// MessagePack-RPC leaves the shape of an error open; one that is not ours is
// kept as its description.
MaybeError errorFrom(const Value& value) {
    if (value.isNone()) {
        return std::nullopt;
    }
    if (!value.isDictionary()) {
        return Error{"", 0, describe(value)};
    }
    const Dictionary parts = value.dictionary();
    return Error{std::string(parts["domain"].text()), parts["code"].integerValue(),
                 std::string(parts["message"].text())};
}

} // namespace

std::optional<Answer> decodeAnswer(std::string_view frame) {
    ValueDecoder decoder(frame, nullptr);
    const Token whole = decoder.next();
    if (whole.family != Family::Array || whole.size != kAnswerLength) {
        return std::nullopt;
    }
    const auto type = Integer::from(decoder.next());
    const auto messageID = Integer::from(decoder.next());
    if (!type || type->as<std::uint64_t>() != kAnswerType || !messageID ||
        !messageID->as<std::uint32_t>()) {
        return std::nullopt;
    }
    Answer answer;
    answer.messageID = *messageID->as<std::uint32_t>();
    answer.error = errorFrom(decoder.value(decoder.next(), kPartDepth));
    answer.result = decoder.value(decoder.next(), kPartDepth);
    if (decoder.problem() != ValueDecoder::Problem::None || !decoder.atEnd()) {
        return std::nullopt;
    }
    return answer;
}

} // namespace halyard::protocol
