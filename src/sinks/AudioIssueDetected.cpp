#include "sinks/AudioIssueDetected.h"

#include <functional>
#include <utility>

#include "common/Description.h"
#include "common/Utf8.h"
#include "common/Value.h"

namespace tmxmetrics {
namespace {

enum Field : std::uint32_t {
    kTimestamp = 1,
    kDuration = 2,
    kIssueType = 3,
    kNode = 4,
    kRtaidClient = 5,
};

} // namespace

void AudioIssueDetected::writeTo(protozero::pbf_writer& writer) const {
    if (timestamp) {
        writer.add_uint64(kTimestamp, *timestamp);
    }
    writer.add_int32(kDuration, duration);
    writer.add_bytes(kIssueType, issuetype);
    writer.add_bytes(kNode, node);
    writer.add_bytes(kRtaidClient, rtaidclient);
}

std::string AudioIssueDetected::encoded() const {
    std::string bytes;
    protozero::pbf_writer writer(bytes);
    writeTo(writer);
    return bytes;
}

bool AudioIssueDetected::readFrom(WireReader& reader) {
    while (!reader.atEnd()) {
        const WireReader::Key key = reader.readKey();
        if (reader.failed() || key.wireType == WireReader::kEndGroup) {
            break;
        }
        switch (key.field) {
        case kTimestamp:
            timestamp = reader.readVarint();
            break;
        case kDuration:
            duration = static_cast<std::int32_t>(reader.readVarint());
            break;
        case kIssueType:
            issuetype = reader.readBytes();
            break;
        case kNode:
            node = reader.readBytes();
            break;
        case kRtaidClient:
            rtaidclient = reader.readBytes();
            break;
        default:
            reader.skip(key);
        }
    }
    return !reader.failed();
}

void AudioIssueDetected::formatText(std::string& out, std::string_view name) const {
    using halyard::replaceInvalidUtf8;
    halyard::Dictionary fields{{"duration", duration},
                               {"issuetype", replaceInvalidUtf8(issuetype)},
                               {"node", replaceInvalidUtf8(node)},
                               {"rtaidclient", replaceInvalidUtf8(rtaidclient)}};
    if (timestamp) {
        fields.set("timestamp", *timestamp);
    }
    out.append(name).append(" = ");
    halyard::appendDescription(out, fields);
}

std::uint64_t AudioIssueDetected::hash_value() const {
    const std::hash<std::string> hash;
    return timestamp.value_or(0) ^ static_cast<std::uint64_t>(std::int64_t{duration}) ^
           hash(issuetype) ^ hash(node) ^ hash(rtaidclient);
}

void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept {
    AudioIssueDetected kept = std::move(left);
    left = std::move(right);
    right = std::move(kept);
}

} // namespace tmxmetrics
