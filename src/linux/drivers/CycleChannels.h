// The channels of the devices whose cycles a program of the user's session counts.
// It leaves its counts in a folder that the daemon has made: four files for each
// device, as docs/drivers.md says.
//
// Devices come and go while the daemon runs, and groups are subscribed to but once,
// so the devices are looked for whenever the group is sampled. Whoever may connect
// may write there, and anybody may fill the folder: a look at it is bounded, and a
// device that was found keeps its place.
//
// Not thread-safe.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/SampleSet.h"
#include "linux/drivers/SharedFolder.h"

namespace halyard::linux_ {

class CycleChannels {
public:
    static constexpr std::size_t kMaxDevices = 8;

    struct Direction {
        const char* group;
        std::string_view prefix; // of its files
    };
    static constexpr Direction kDirections[] = {{"Speaker", "out-"}, {"Rx", "in-"}};

    // Whether somebody else provides that channel.
    using Taken = std::function<bool(const DriverChannel& names)>;
    // May change `failing`, which is the channel's own from one read to the next.
    using Visit =
        std::function<void(const ChannelFactsRef& facts, bool& failing, const Reading& reading)>;

    CycleChannels(std::shared_ptr<const SharedFolder> folder, std::shared_ptr<SourceRoot> root,
                  const Direction& direction, Taken taken);

    std::string_view group() const { return direction_.group; }
    // Looks which devices there are, and visits each channel of theirs. False when
    // there may be devices that were not visited.
    bool read(platform::SteadyTime now, const Visit& visit);

private:
    struct Channel {
        ChannelFactsRef facts;
        std::unique_ptr<ChannelSource> source;
        bool failing = false;
    };
    struct Device {
        std::string stem;   // of the names of its files
        std::string driver; // what it is called
        int number = 1;     // among those whose names are alike in reports
        std::vector<Channel> channels;
    };
    enum class Presence { There, NotThere, Unknown };

    bool findDevices();
    // False when it cannot be told whether that is a device's file, or has no place.
    bool consider(std::string_view name);
    Presence presenceOf(const std::string& stem) const;
    void addDevice(std::string stem, std::string driver);
    void addChannel(Device& device, const char* name, const char* suffix, const char* row);
    SampledFile file(const std::string& name) const;

    const std::shared_ptr<const SharedFolder> folder_;
    const std::shared_ptr<SourceRoot> root_;
    const Direction direction_;
    const Taken taken_;
    std::vector<Device> devices_;
    std::size_t triesLeft_ = 0; // of this look
};

// The name of the device whose files begin with `stem` behind the direction's
// prefix; none when no device's do.
std::optional<std::string> cycleDeviceName(std::string_view stem);

} // namespace halyard::linux_
