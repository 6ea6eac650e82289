// The diagnostics metric of a detected audio issue, and its encoding as a
// protocol-buffers message:
//
//     message AudioIssueDetected {
//         optional uint64 timestamp = 1;
//         required int32 duration = 2;
//         required bytes issuetype = 3;
//         required bytes node = 4;
//         required bytes rtaidclient = 5;
//     }
#pragma once

#include <cstdint>
#include <optional>
#include <protozero/pbf_writer.hpp>
#include <string>
#include <string_view>

#include "sinks/WireReader.h"

namespace tmxmetrics {

class AudioIssueDetected {
public:
    AudioIssueDetected() = default;
    AudioIssueDetected(const AudioIssueDetected&) = default;
    AudioIssueDetected(AudioIssueDetected&&) noexcept = default;
    AudioIssueDetected& operator=(const AudioIssueDetected&) = default;
    AudioIssueDetected& operator=(AudioIssueDetected&&) noexcept = default;
    virtual ~AudioIssueDetected() = default;

    // Every field but the timestamp, which is written only when present.
    void writeTo(protozero::pbf_writer& writer) const;
    std::string encoded() const;

    // Takes what the bytes hold on top of what is set, and skips fields it does
    // not know. Stops at the end of an enclosing group. False when the bytes are
    // malformed; the fields read until then stay.
    [[nodiscard]] bool readFrom(WireReader& reader);

    // Appends "name = { … }", for logs.
    void formatText(std::string& out, std::string_view name) const;

    std::uint64_t hash_value() const;

    friend bool operator==(const AudioIssueDetected&, const AudioIssueDetected&) = default;
    friend void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept;

    std::string issuetype;
    std::string node;
    std::string rtaidclient;
    std::optional<std::uint64_t> timestamp;
    std::int32_t duration = 0;
};

} // namespace tmxmetrics
