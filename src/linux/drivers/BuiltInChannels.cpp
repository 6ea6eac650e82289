#include "linux/drivers/BuiltInChannels.h"

#include <algorithm>
#include <filesystem>
#include <fmt/format.h>
#include <iterator>
#include <optional>
#include <set>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kMaxCards = 8;
constexpr std::size_t kMaxStreams = 8; // of each direction
constexpr std::size_t kMaxProcessors = 16;
constexpr std::size_t kMaxDevices = 8; // of each other kind
constexpr std::size_t kMaxActions = 16;
constexpr std::size_t kMaxFactFile = 4096;
constexpr std::size_t kMaxEntries = 1024; // of a directory

// Parts of the names under which audio drivers ask for their interrupts.
constexpr std::string_view kAudioActions[] = {"snd",   "audio", "i2s",       "sof",
                                              "codec", "pcm",   "soundwire", "hda"};

// One directory's entries by name: numbers in names in their order, then text.
std::vector<std::string> entries(const fs::path& directory) {
    std::vector<std::string> names;
    std::error_code ignored;
    fs::directory_iterator at(directory, ignored);
    for (; at != fs::directory_iterator() && names.size() < kMaxEntries; at.increment(ignored)) {
        names.push_back(at->path().filename().native());
    }
    std::sort(names.begin(), names.end(), [](const std::string& left, const std::string& right) {
        return std::pair(left.size(), left) < std::pair(right.size(), right);
    });
    return names;
}

std::optional<std::string> fact(const fs::path& path) {
    const auto read = readSmallFile(path, kMaxFactFile);
    if (!read.ok()) {
        return std::nullopt;
    }
    return read.value().substr(0, read.value().find('\n'));
}

bool isThere(const fs::path& path) {
    std::error_code ignored;
    return fs::exists(path, ignored);
}

// "cpu0", not "cpufreq".
bool isNumbered(std::string_view name, std::string_view prefix) {
    return name.size() > prefix.size() && name.starts_with(prefix) &&
           name.find_first_not_of("0123456789", prefix.size()) == std::string_view::npos;
}

// The names in `directory` that are `prefix` and a number.
std::vector<std::string> numbered(const fs::path& directory, std::string_view prefix,
                                  std::size_t most) {
    auto names = entries(directory);
    std::erase_if(names, [&](const std::string& name) { return !isNumbered(name, prefix); });
    names.resize(std::min(names.size(), most));
    return names;
}

class Finder {
public:
    explicit Finder(const SourceRoot& root) : root_(root) {}

    std::vector<DriverChannel> find() {
        findCards();
        findStreams();
        findProcessors();
        findHaptics();
        findFrequencies();
        findNetworks();
        findInterrupts();
        findPressure();
        return std::move(found_);
    }

private:
    struct Group {
        const char* name;
        const char* subgroup; // or null
    };

    fs::path at(const std::string& path) const { return root_.resolve(path); }
    // The name of the driver that a device's directory belongs to.
    std::string driverOf(const std::string& device) const {
        std::error_code ignored;
        return fs::read_symlink(at(device + "/driver"), ignored).filename().native();
    }
    void add(const Group& group, std::string driver, std::string name, ChannelFormat format,
             std::string source, std::string unit = {}) {
        DriverChannel channel;
        channel.group = group.name;
        if (group.subgroup != nullptr) {
            channel.subgroup = group.subgroup;
        }
        channel.driver = std::move(driver);
        channel.name = distinctName(channel, name);
        channel.unit = std::move(unit);
        channel.format = format;
        channel.source = std::move(source);
        found_.push_back(std::move(channel));
    }
    // The name, with a number where a like device has it already.
    std::string distinctName(DriverChannel channel, const std::string& name) const {
        channel.name = name;
        for (int number = 2; isFound(channel); ++number) {
            channel.name = fmt::format("{} {}", name, number);
        }
        return channel.name;
    }
    bool isFound(const DriverChannel& channel) const {
        return std::any_of(found_.begin(), found_.end(), [&](const DriverChannel& each) {
            return each.group == channel.group && each.subgroup == channel.subgroup &&
                   asInKeys(each.driver) == asInKeys(channel.driver) &&
                   asInKeys(each.name) == asInKeys(channel.name);
        });
    }
    // Unless nothing manages the device's power.
    void addPower(const Group& group, const std::string& device, const std::string& name) {
        const auto status = fact(at(device + "/power/runtime_status"));
        if (status && *status != "unsupported") {
            add(group, driverOf(device), name, ChannelFormat::State, "runtime_pm:" + device);
        }
    }

    void findCards();
    void findStreams();
    void addStream(const Group& group, const std::string& card, const std::string& stream);
    void findProcessors();
    void findHaptics();
    void findFrequencies();
    void findNetworks();
    void findInterrupts();
    void findPressure();

    const SourceRoot& root_;
    std::vector<DriverChannel> found_;
};

// The audio chips: when they are powered.
void Finder::findCards() {
    for (const auto& card : numbered(at("/sys/class/sound"), "card", kMaxCards)) {
        addPower({"KestrelZR4QLX", nullptr}, "/sys/class/sound/" + card + "/device",
                 card + " Power");
    }
}

// What is played stands with the speaker, what is recorded with what comes in.
void Finder::findStreams() {
    std::size_t played = 0;
    std::size_t recorded = 0;
    for (const auto& card : numbered(at("/proc/asound"), "card", kMaxCards)) {
        for (const auto& stream : entries(at("/proc/asound/" + card))) {
            if (!stream.starts_with("pcm")) {
                continue;
            }
            if (stream.ends_with('p') && played++ < kMaxStreams) {
                addStream({"Speaker", nullptr}, card, stream);
            } else if (stream.ends_with('c') && recorded++ < kMaxStreams) {
                addStream({"Rx", nullptr}, card, stream);
            }
        }
    }
}

// Its first substream: others are for what few devices mix in hardware.
void Finder::addStream(const Group& group, const std::string& card, const std::string& stream) {
    const std::string directory = "/proc/asound/" + card + "/" + stream + "/sub0";
    if (!isThere(at(directory + "/status"))) {
        return;
    }
    const std::string driver = fact(at("/proc/asound/" + card + "/id")).value_or(card);
    add(group, driver, stream + " Frames", ChannelFormat::Simple, "alsa_frames:" + directory,
        "frames");
    add(group, driver, stream + " Xruns", ChannelFormat::Simple, "alsa_xruns:" + directory);
    add(group, driver, stream + " Restarts", ChannelFormat::Simple, "alsa_restarts:" + directory);
    add(group, driver, stream + " State", ChannelFormat::State, "alsa_states:" + directory);
}

// The processors that mix what no chip mixes: how deep they sleep between periods.
void Finder::findProcessors() {
    const std::string parent = "/sys/devices/system/cpu";
    const std::string driver = fact(at(parent + "/cpuidle/current_driver")).value_or("");
    for (const auto& processor : numbered(at(parent), "cpu", kMaxProcessors)) {
        const std::string directory = parent + "/" + processor + "/cpuidle";
        if (isThere(at(directory + "/state0"))) {
            add({"CPUIdle", "QLX"}, driver, processor, ChannelFormat::State,
                "cpuidle:" + directory);
        }
    }
}

// Input devices with force feedback, and vibrators that are driven like a light.
void Finder::findHaptics() {
    const Group group{"Haptics", "Stats"};
    std::size_t count = 0;
    for (const auto& input : numbered(at("/sys/class/input"), "input", kMaxEntries)) {
        const std::string device = "/sys/class/input/" + input;
        const auto effects = fact(at(device + "/capabilities/ff"));
        if (effects && effects->find_first_not_of("0 ") != std::string::npos &&
            count++ < kMaxDevices) {
            addPower(group, device + "/device", fact(at(device + "/name")).value_or(input));
        }
    }
    for (const auto& light : entries(at("/sys/class/leds"))) {
        if (light.find("vibrator") != std::string::npos && count++ < kMaxDevices) {
            addPower(group, "/sys/class/leds/" + light + "/device", light);
        }
    }
}

// The frequencies that processors and buses ran at while the session lasted.
void Finder::findFrequencies() {
    const Group group{"StateTransitionTimes_ms", nullptr};
    const std::string policies = "/sys/devices/system/cpu/cpufreq";
    for (const auto& policy : numbered(at(policies), "policy", kMaxDevices)) {
        const std::string directory = policies + "/" + policy;
        if (isThere(at(directory + "/stats/time_in_state"))) {
            add(group, fact(at(directory + "/scaling_driver")).value_or(""), policy,
                ChannelFormat::State, "cpufreq:" + directory + "/stats");
        }
    }
    std::size_t count = 0;
    for (const auto& device : entries(at("/sys/class/devfreq"))) {
        const std::string directory = "/sys/class/devfreq/" + device;
        if (isThere(at(directory + "/trans_stat")) && count++ < kMaxDevices) {
            add(group, "", device, ChannelFormat::State, "devfreq:" + directory);
        }
    }
}

// Links that audio may come or go by; only real ones, which have a device.
void Finder::findNetworks() {
    constexpr const char* kCounters[] = {"packets", "dropped", "errors", "fifo_errors"};
    std::size_t count = 0;
    for (const auto& link : entries(at("/sys/class/net"))) {
        const std::string directory = "/sys/class/net/" + link;
        if (!isThere(at(directory + "/device")) || count++ == kMaxDevices) {
            continue;
        }
        const std::string driver = driverOf(directory + "/device");
        for (const auto& [group, prefix] : {std::pair("Rx", "rx"), std::pair("Tx", "tx")}) {
            for (const char* counter : kCounters) {
                add({group, nullptr}, driver, fmt::format("{} {}", link, counter),
                    ChannelFormat::Simple,
                    fmt::format("file:{}/statistics/{}_{}", directory, prefix, counter));
            }
        }
    }
}

void Finder::findInterrupts() {
    std::set<std::string> actions;
    for (const auto& line : entries(at("/sys/kernel/irq"))) {
        std::string rest = fact(at("/sys/kernel/irq/" + line + "/actions")).value_or("");
        while (!rest.empty()) {
            const std::string action = rest.substr(0, rest.find(','));
            rest.erase(0, action.size() + 1);
            if (std::any_of(std::begin(kAudioActions), std::end(kAudioActions),
                            [&](auto part) { return action.find(part) != std::string::npos; }) &&
                actions.size() < kMaxActions) {
                actions.insert(action);
            }
        }
    }
    for (const auto& action : actions) {
        add({"Interrupts", "HWAudio2"}, "", action, ChannelFormat::Simple, "irq:" + action);
    }
}

// Time, µs, in which work waited for the machine, and audio with it.
void Finder::findPressure() {
    constexpr std::pair<const char*, const char*> kLines[] = {
        {"cpu", "some"}, {"io", "some"}, {"io", "full"}, {"memory", "some"}, {"memory", "full"}};
    for (const auto& [resource, line] : kLines) {
        const std::string path = std::string("/proc/pressure/") + resource;
        if (isThere(at(path))) {
            add({"Pressure", "HWAudio2"}, "", fmt::format("{} {}", resource, line),
                ChannelFormat::Simple, fmt::format("pressure:{}:{}", path, line), "us");
        }
    }
}

} // namespace

std::vector<DriverChannel> builtInChannels(const SourceRoot& root) {
    return Finder(root).find();
}

} // namespace halyard::linux_
