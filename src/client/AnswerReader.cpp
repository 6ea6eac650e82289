#include "client/AnswerReader.h"

#include <optional>
#include <string_view>

namespace halyard::client {

bool AnswerReader::read(Connection& connection, const Take& take) {
    char chunk[16 * 1024];
    std::size_t count = 0;
    switch (connection.receive(chunk, count)) {
    case Connection::Outcome::WouldBlock:
        return true;
    case Connection::Outcome::Lost:
        return false;
    case Connection::Outcome::Done:
        stream_.append(chunk, count);
        return cut(take);
    }
    return false;
}

bool AnswerReader::cut(const Take& take) {
    using Outcome = protocol::FrameScanner::Outcome;
    std::string_view rest = stream_;
    Outcome outcome = scanner_.scan(rest);
    while (outcome == Outcome::Complete) {
        const std::size_t length = scanner_.frameLength();
        const std::optional<protocol::Answer> answer =
            protocol::decodeAnswer(rest.substr(0, length));
        if (!answer) {
            return false;
        }
        take(*answer);
        rest.remove_prefix(length);
        scanner_.reset();
        if (rest.empty()) {
            stream_.clear();
            return true;
        }
        outcome = scanner_.scan(rest);
    }
    stream_.erase(0, stream_.size() - rest.size());
    return outcome == Outcome::Incomplete;
}

void AnswerReader::reset() {
    scanner_.reset();
    stream_.clear();
}

} // namespace halyard::client
