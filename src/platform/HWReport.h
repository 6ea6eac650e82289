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

// One entry of a sample set, for as long as it is iterated. The values of
// another format than its own are 0, and so is what lies past a count.
class HWReportChannel {
public:
    using Text = std::optional<std::string_view>;

    virtual ~HWReportChannel() = default;
    virtual std::uint8_t getFormat() const = 0;
    virtual Text getDriverName() const = 0;
    virtual Text getGroup() const = 0;
    virtual Text getSubGroup() const = 0;
    virtual Text getChannelName() const = 0;
    virtual Text getUnitLabel() const = 0;

    virtual std::int64_t simpleGetIntegerValue() const = 0;

    virtual std::int32_t histogramGetBucketCount() const = 0;
    // 0, or an error that leaves the bounds as they are.
    virtual int histogramGetBucketBounds(std::int32_t index, std::int64_t& lower,
                                         std::int64_t& upper) const = 0;
    virtual std::int64_t histogramGetBucketHits(std::int32_t index) const = 0;
    virtual std::int64_t histogramGetMinValue() const = 0;
    virtual std::int64_t histogramGetMaxValue() const = 0;

    virtual std::int32_t stateGetCount() const = 0;
    virtual Text stateGetNameForIndex(std::int32_t index) const = 0;
    virtual std::uint64_t stateGetInTransitions(std::int32_t index) const = 0;
    virtual std::uint64_t stateGetResidency(std::int32_t index) const = 0;
    // The share of the time that the set covers.
    virtual double stateGetDutyCycle(std::int32_t index) const = 0;
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
