// MessagePack-RPC, the server's and the client's side of it: bytes to calls and
// answers, and back. No sockets here.
//
// Format: MessagePack and MessagePack-RPC, as msgpack.org describes them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "common/Error.h"
#include "common/KeyTable.h"
#include "common/Value.h"
#include "protocol/Request.h"

namespace halyard::protocol {

inline constexpr std::size_t kMaxFrameBytes = 1024 * 1024;
inline constexpr int kMaxDepth = 32;
inline constexpr std::uint32_t kMaxElements = 65536;

// Finds the end of the MessagePack object at the front of a byte stream, without
// decoding it. Keeps its place between calls, so that a frame which comes in
// many pieces is scanned once.
//
// Depth: the frame's own array is 1. Elements: every object inside the frame,
// containers, keys and values alike, the frame itself not counted. A limit is
// reported as soon as a head announces more than it allows, so no memory has to
// be held for bytes that will not be taken.
class FrameScanner {
public:
    enum class Outcome {
        Incomplete, // More bytes are needed.
        Complete,   // frameLength() bytes make one frame.
        TooLarge,
        TooDeep,
        TooManyElements,
        Malformed, // A byte that no MessagePack object begins with (0xC1).
    };

    // `stream` begins with the frame and holds at least the bytes of the
    // previous call. After anything but Incomplete, call reset() before the next
    // frame.
    [[nodiscard]] Outcome scan(std::string_view stream);
    std::size_t frameLength() const { return position_; }
    // Of all containers so far.
    std::size_t elements() const { return elements_; }
    void reset();

private:
    // Passes the objects that need no second look, as far as they go.
    void skipPlain(std::string_view stream);
    // Complete: one more object has been passed.
    Outcome step(std::string_view rest);
    void take(bool opens, std::uint32_t children);

    std::size_t position_ = 0;
    std::uint32_t pending_ = 1; // Objects announced but not yet passed.
    std::uint32_t elements_ = 0;
    int depth_ = 0;
    std::uint32_t remaining_[kMaxDepth] = {}; // Objects missing in each open container.
};

// One frame as the server reads it.
struct Call {
    std::optional<std::uint32_t> messageID; // nullopt: a notification
    // What to run, or why it cannot be run (the answer, in the IPC domain).
    std::optional<Method> method;
    Arguments arguments; // Empty beside an error.
    MaybeError error;
};

// Decodes complete frames. Not thread-safe; one per delivery thread.
class CallDecoder {
public:
    // Nullopt when the frame is no MessagePack-RPC request or notification: the
    // connection is not to be kept. Requires that FrameScanner found `frame`
    // Complete; other bytes are memory-safe, but mean nothing.
    [[nodiscard]] std::optional<Call> decode(std::string_view frame);

private:
    KeyTable keys_;
};

// Appends `[1, messageID, error, result]`.
void appendAnswer(std::string& out, std::uint32_t messageID, const MaybeError& error,
                  const Value& result);

// The client's side.

// Appends a request, or a notification when there is no message ID. Only the
// arguments that the method takes are written. The frame's limits are the
// caller's to keep: the peer closes the connection on what exceeds them.
void appendCall(std::string& out, std::optional<std::uint32_t> messageID, Method method,
                const Arguments& arguments);

struct Answer {
    std::uint32_t messageID = 0;
    MaybeError error;
    Value result;
};

// Nullopt when the frame is no answer. Requires what CallDecoder::decode does.
[[nodiscard]] std::optional<Answer> decodeAnswer(std::string_view frame);

// Appends `value` as MessagePack; doubles always as float64, so that a real
// keeps its kind.
void appendValue(std::string& out, const Value& value);

// The pieces, for a caller that writes an object as it goes: a string, and the
// heads of containers, to be followed by `size` objects (a map: pairs).
void appendText(std::string& out, std::string_view text);
void appendArray(std::string& out, std::size_t size);
void appendMap(std::string& out, std::size_t size);

std::string_view methodName(Method method);

} // namespace halyard::protocol
