// The statistics that the drivers of the device publish, as a library of
// channels: a channel is a counter, a histogram or the residencies of states,
// found by its group and subgroup, subscribed to once and sampled as a set.
//
// Channel descriptions and sample sets are opaque and unchanging; whoever holds
// a reference may read them from any thread. The library itself has one caller
// at a time. Nothing here blocks for longer than reading the statistics takes,
// and one driver that hangs or has gone costs its own channels only.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::platform {

struct HWReportError {
    std::int64_t code = 0;
};

// What an operation yields. An error beside a value tells that the value is not
// all there could be; no value and no error that there is nothing.
template <class T> struct HWReportResult {
    T value{};
    std::optional<HWReportError> error;
};

// Others may come up; nobody here can read their values.
inline constexpr std::uint8_t kHWReportFormatSimple = 1;
inline constexpr std::uint8_t kHWReportFormatState = 2;
inline constexpr std::uint8_t kHWReportFormatHistogram = 3;
// Above are formats that nobody has heard of; 0 and this one are known, unused.
inline constexpr std::uint8_t kHWReportFormatLast = 4;

// One entry of a sample set, for as long as it is iterated: its texts are
// borrowed from the set. Only what belongs to its format is filled in.
struct HWReportChannel {
    using Text = std::optional<std::string_view>;
    struct Bucket {
        std::int64_t lower = 0;
        std::int64_t upper = 0;
        std::int64_t hits = 0;
        int boundsError = 0; // not 0: nobody knows the bounds
    };
    struct State {
        Text name;
        std::uint64_t transitions = 0; // into the state
        std::uint64_t residency = 0;
        double dutyCycle = 0; // the share of the time that the set covers
    };

    std::uint8_t format = 0;
    Text driver, group, subGroup, name, unit;

    std::int64_t value = 0; // of a simple one

    std::vector<Bucket> buckets; // of a histogram,
    std::int64_t min = 0;        // with the ends of what it recorded
    std::int64_t max = 0;

    std::vector<State> states;
};

class HWReportChannels {
public:
    virtual ~HWReportChannels() = default;
};
using HWReportChannelsRef = std::shared_ptr<const HWReportChannels>;

class HWReportSamples {
public:
    virtual ~HWReportSamples() = default;
};
using HWReportSamplesRef = std::shared_ptr<const HWReportSamples>;

class HWReportSubscription {
public:
    virtual ~HWReportSubscription() = default;
};

struct HWReportSubscribed {
    // Borrowed from the library, which keeps it for good; null when it failed.
    HWReportSubscription* subscription = nullptr;
    // What was subscribed to in fact; may be null.
    HWReportChannelsRef channels;
};

class HWReport {
public:
    virtual ~HWReport() = default;

    // The channels of that group and subgroup; an absent name matches any.
    [[nodiscard]] virtual HWReportResult<HWReportChannelsRef>
    copyChannelsInGroup(const std::optional<std::string>& group,
                        const std::optional<std::string>& subGroup) = 0;
    virtual std::int64_t getChannelCount(const HWReportChannels& channels) const = 0;
    virtual HWReportSubscribed createSubscription(const HWReportChannels& channels) = 0;
    // The values as they are now. Nulls are an error, no crash: a subscription
    // that failed is only noticed here.
    [[nodiscard]] virtual HWReportResult<HWReportSamplesRef>
    createSamples(HWReportSubscription* subscription, const HWReportChannels* channels) = 0;
    // What changed from `previous`, which may be absent, to `current`.
    [[nodiscard]] virtual HWReportResult<HWReportSamplesRef>
    createSamplesDelta(const HWReportSamples* previous, const HWReportSamples& current) = 0;
    // Calls back once for each channel, until one call does not return 0.
    virtual void iterate(const HWReportSamples& samples,
                         const std::function<int(const HWReportChannel&)>& callback) const = 0;
};

// The sample sets of all drivers at one moment, by the driver's description.
using DriverSnapshot = std::map<std::string, HWReportSamplesRef, std::less<>>;
using DriverSnapshotRef = std::shared_ptr<const DriverSnapshot>;

} // namespace halyard::platform
