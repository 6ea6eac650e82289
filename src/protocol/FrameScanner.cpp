#include "protocol/MessagePack.h"
#include "protocol/Wire.h"

namespace halyard::protocol {

void FrameScanner::reset() {
    position_ = 0;
    pending_ = 1;
    elements_ = 0;
    depth_ = 0;
}

FrameScanner::Outcome FrameScanner::scan(std::string_view stream) {
    while (pending_ > 0) {
        skipPlain(stream);
        if (pending_ == 0) {
            break;
        }
        const Outcome outcome = step(stream.substr(position_));
        if (outcome != Outcome::Complete) {
            return outcome;
        }
    }
    return Outcome::Complete;
}

void FrameScanner::skipPlain(std::string_view stream) {
    std::size_t at = position_;
    std::uint32_t pending = pending_;
    while (depth_ > 0) {
        std::uint32_t left = remaining_[depth_ - 1];
        for (; left > 0 && at < stream.size(); --left, --pending) {
            const std::size_t length = kPlainLengths[static_cast<unsigned char>(stream[at])];
            if (length == 0 || stream.size() - at < length ||
                at + length + (pending - 1) > kMaxFrameBytes) {
                break;
            }
            at += length;
        }
        remaining_[depth_ - 1] = left;
        if (left > 0) {
            break;
        }
        --depth_;
    }
    position_ = at;
    pending_ = pending;
}

FrameScanner::Outcome FrameScanner::step(std::string_view rest) {
    if (rest.empty()) {
        return Outcome::Incomplete;
    }
    const Format format = kFormats[static_cast<unsigned char>(rest.front())];
    if (format.family == Family::Invalid) {
        return Outcome::Malformed;
    }
    const std::size_t head = 1U + format.lengthBytes;
    if (rest.size() < head) {
        return Outcome::Incomplete;
    }
    const Token object{format.family, format.size + loadBig(rest.data() + 1, format.lengthBytes),
                       nullptr};
    const bool opens = isContainer(object.family);
    const std::size_t children = object.children();
    const std::size_t length = opens ? head : head + object.size;
    // Whatever is still to come takes a byte at least.
    if (position_ + length + (pending_ - 1) + children > kMaxFrameBytes) {
        return Outcome::TooLarge;
    }
    if (elements_ + children > kMaxElements) {
        return Outcome::TooManyElements;
    }
    if (opens && depth_ == kMaxDepth) {
        return Outcome::TooDeep;
    }
    if (rest.size() < length) {
        return Outcome::Incomplete;
    }
    position_ += length;
    take(opens, static_cast<std::uint32_t>(children));
    return Outcome::Complete;
}

void FrameScanner::take(bool opens, std::uint32_t children) {
    --pending_;
    if (depth_ > 0) {
        --remaining_[depth_ - 1];
    }
    if (opens) {
        remaining_[depth_] = children;
        ++depth_;
        pending_ += children;
        elements_ += children;
    }
    while (depth_ > 0 && remaining_[depth_ - 1] == 0) {
        --depth_; // The next object belongs to what is around it.
    }
}

} // namespace halyard::protocol
