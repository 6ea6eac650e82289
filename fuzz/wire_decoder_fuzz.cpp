// The path of a peer's bytes: scanned in pieces of any size, decoded, and what
// was understood encoded and decoded again.
//
// The first byte of the input chooses the sizes of the pieces.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "protocol/Wire.h"

namespace {

using namespace halyard;
using namespace halyard::protocol;
using Outcome = FrameScanner::Outcome;

void require(bool condition, const char* what) {
    if (!condition) {
        std::fprintf(stderr, "broken: %s\n", what);
        std::abort();
    }
}

struct Scan {
    Outcome outcome;
    std::size_t length;
    std::size_t seen; // Bytes at hand when the outcome came.
};

Scan scanInPieces(std::string_view stream, unsigned seed) {
    FrameScanner scanner;
    std::size_t seen = 0;
    Outcome outcome = scanner.scan({});
    while (outcome == Outcome::Incomplete && seen < stream.size()) {
        seed = seed * 1103515245U + 12345U;
        seen = std::min(stream.size(), seen + 1 + (seed >> 16U) % 23);
        // A copy of its own, so that reading past the piece is noticed.
        const std::vector<char> piece(stream.begin(), stream.begin() + seen);
        outcome = scanner.scan({piece.data(), piece.size()});
    }
    return {outcome, scanner.frameLength(), seen};
}

Scan scanAtOnce(std::string_view stream) {
    FrameScanner scanner;
    const Outcome outcome = scanner.scan(stream);
    return {outcome, scanner.frameLength(), stream.size()};
}

// What was decoded, encoded, decoded and encoded again, is the same bytes.
void checkCall(const Call& call, CallDecoder& decoder) {
    require(call.method.has_value() != call.error.has_value(), "a call or a reason, not both");
    if (!call.method) {
        return;
    }
    std::string once;
    appendCall(once, call.messageID, *call.method, call.arguments);
    const Scan scan = scanAtOnce(once);
    require(scan.outcome == Outcome::Complete && scan.length == once.size(), "our call scans");
    const auto again = decoder.decode(once);
    require(again && again->method == call.method, "our call decodes");
    std::string twice;
    appendCall(twice, again->messageID, *again->method, again->arguments);
    require(once == twice, "a call keeps its meaning");
}

void checkAnswer(const Answer& answer) {
    std::string once;
    appendAnswer(once, answer.messageID, answer.error, answer.result);
    const auto again = decodeAnswer(once);
    require(again && again->messageID == answer.messageID && again->error == answer.error,
            "our answer decodes");
    std::string twice;
    appendAnswer(twice, again->messageID, again->error, again->result);
    require(once == twice, "an answer keeps its meaning");
}

void decodeBytes(std::string_view bytes, CallDecoder& decoder, bool scanned) {
    if (const auto call = decoder.decode(bytes); call && scanned) {
        checkCall(*call, decoder);
    }
    if (const auto answer = decodeAnswer(bytes); answer && scanned) {
        checkAnswer(*answer);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) {
        return 0;
    }
    const std::string_view input(reinterpret_cast<const char*>(data), size);
    std::string_view stream = input.substr(1);
    CallDecoder decoder;
    decodeBytes(stream, decoder, false);
    while (!stream.empty()) {
        const Scan pieces = scanInPieces(stream, data[0]);
        const Scan whole = scanAtOnce(stream);
        require(pieces.outcome == whole.outcome && pieces.length == whole.length,
                "pieces do not matter");
        if (whole.outcome != Outcome::Complete) {
            break;
        }
        require(whole.length > 0 && whole.length <= stream.size(), "a frame is inside the stream");
        decodeBytes(stream.substr(0, whole.length), decoder, true);
        stream.remove_prefix(whole.length);
    }
    return 0;
}
