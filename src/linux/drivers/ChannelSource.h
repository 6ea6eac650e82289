// Where the numbers of one statistics channel come from.
//
// A source reads its files each time it is asked and remembers only what spares
// work: open files, the names of states. Not thread-safe; distinct sources may
// be read by different threads.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "linux/drivers/SampledFile.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

// What a reading's numbers stand for; shared by the readings of a source for as
// long as it does not change.
struct ReadingShape {
    std::vector<std::string> states;
    std::vector<std::pair<std::int64_t, std::int64_t>> bounds; // of buckets

    bool operator==(const ReadingShape&) const = default;
};
using ReadingShapeRef = std::shared_ptr<const ReadingShape>;

enum class ReadStatus : std::uint8_t {
    Read,
    Absent, // The device, or the file, is not there.
    Failed, // It is there and cannot be read, or not in this format.
};

// Simple: one number, the bits of a signed one. State: residency and transitions
// of each state in turn. Histogram: the hits of each bucket.
struct Reading {
    ReadStatus status = ReadStatus::Failed;
    std::string fault; // why it is not Read
    ReadingShapeRef shape;
    std::vector<std::uint64_t> numbers;
};

class ChannelSource {
public:
    virtual ~ChannelSource() = default;
    virtual Reading read(platform::SteadyTime now) = 0;
};

// The file system that paths are resolved in. Borrowed by the sources.
struct SourceRoot {
    std::filesystem::path path = "/";
    DescriptorBudget descriptors{256};

    // `absolute` below the root.
    std::filesystem::path resolve(const std::filesystem::path& absolute) const {
        return path / absolute.relative_path();
    }
};

} // namespace halyard::linux_
