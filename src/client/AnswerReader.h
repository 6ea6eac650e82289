// Bytes from the daemon, cut into answers.
//
// Belongs to the client's thread.
#pragma once

#include <functional>
#include <string>

#include "client/Connection.h"
#include "protocol/Wire.h"

namespace halyard::client {

class AnswerReader {
public:
    using Take = std::function<void(const protocol::Answer&)>;

    // Reads what is there and hands over each complete answer. False when the
    // connection is of no more use: ended, or the bytes are no answers.
    [[nodiscard]] bool read(Connection& connection, const Take& take);
    // Forgets a beginning that was read. For a new connection.
    void reset();

private:
    bool cut(const Take& take);

    protocol::FrameScanner scanner_;
    std::string stream_; // Begins with a frame; bounded by the scanner's limits.
};

} // namespace halyard::client
