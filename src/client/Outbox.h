// The block of frames that is being written.
//
// Knows which queued record each frame came from: a record is done with only
// when the last byte of its frame was written, and what was not is sent again
// on the next connection, in whole.
//
// Belongs to the client's thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "client/Record.h"

namespace halyard::client {

class Outbox {
public:
    // One write() of this size costs per message next to nothing.
    static constexpr std::size_t kBlockBytes = 60 * 1024;

    struct Frame {
        const Record* record; // borrowed from the queue
        std::uint64_t next;   // where the record ends there
        std::optional<std::uint32_t> messageID;
        std::size_t end = 0; // of its bytes in the block
    };

    Outbox() { bytes_.reserve(kBlockBytes + kBlockBytes / 8); }

    bool hasRoom() const { return bytes_.size() < kBlockBytes; }
    bool allWritten() const { return written_ == bytes_.size(); }
    // To append frames to.
    std::string& bytes() { return bytes_; }
    // Closes the frame that was appended last and stands for a record.
    void addFrame(Frame frame) {
        frame.end = bytes_.size();
        frames_.push_back(frame);
    }

    std::string_view unwritten() const { return std::string_view(bytes_).substr(written_); }
    void advance(std::size_t count) { written_ += count; }
    // The next frame that is written, once; null when there is none.
    const Frame* takeWritten() {
        const bool some = taken_ < frames_.size() && frames_[taken_].end <= written_;
        return some ? &frames_[taken_++] : nullptr;
    }
    // Gives back the memory of an unusually large frame.
    void clear() {
        bytes_.clear();
        if (bytes_.capacity() > 4 * kBlockBytes) {
            bytes_.shrink_to_fit();
            bytes_.reserve(kBlockBytes + kBlockBytes / 8);
        }
        frames_.clear();
        written_ = taken_ = 0;
    }

private:
    std::string bytes_;
    std::vector<Frame> frames_;
    std::size_t written_ = 0;
    std::size_t taken_ = 0;
};

} // namespace halyard::client
