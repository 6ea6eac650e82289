#include "linux/drivers/CycleChannels.h"

#include <algorithm>
#include <fmt/format.h>
#include <unistd.h>
#include <utility>

#include "linux/drivers/ChannelSources.h"
#include "linux/drivers/SourceText.h"

namespace halyard::linux_ {
namespace {

constexpr std::string_view kCounts = ".counts";
constexpr std::size_t kMaxTries = 256; // files that may be a device's, in one look
constexpr std::ptrdiff_t kMaxLines = 128;
constexpr std::size_t kHashDigits = 16;
constexpr std::string_view kHexadecimal = "0123456789ABCDEF";

bool isPlain(char character) {
    return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
           (character >= '0' && character <= '9') || character == '-' || character == '.' ||
           character == '_';
}

// "%2F" is "/". Each character has one form only.
std::optional<char> escaped(std::string_view text) {
    const std::size_t high = text.size() < 3 ? std::string_view::npos : kHexadecimal.find(text[1]);
    const std::size_t low = text.size() < 3 ? std::string_view::npos : kHexadecimal.find(text[2]);
    if (high == std::string_view::npos || low == std::string_view::npos) {
        return std::nullopt;
    }
    const char character = static_cast<char>(high * 16 + low);
    return isPlain(character) ? std::nullopt : std::optional(character);
}

// What stands for the rest of a name that is too long for a file's.
bool isAbbreviation(std::string_view text) {
    return text.size() == 1 + kHashDigits && text.starts_with('~') &&
           text.find_first_not_of(kHexadecimal, 1) == std::string_view::npos;
}

// Of few lines: whoever writes the file may have put in what is slow to understand.
std::optional<SourceBuckets> parseCycleBuckets(std::string_view text) {
    return std::count(text.begin(), text.end(), '\n') <= kMaxLines ? parseBuckets(text)
                                                                   : std::nullopt;
}

// What a report makes of a driver's name.
std::string inReports(const std::string& driver) {
    return asInKeys(driver.substr(0, driver.find('<')));
}

} // namespace

std::optional<std::string> cycleDeviceName(std::string_view stem) {
    std::string name;
    while (!stem.empty()) {
        if (isPlain(stem.front())) {
            name += stem.front();
            stem.remove_prefix(1);
        } else if (isAbbreviation(stem)) {
            name += stem;
            stem = {};
        } else if (const auto character = stem.front() == '%' ? escaped(stem) : std::nullopt) {
            name += *character;
            stem.remove_prefix(3);
        } else {
            return std::nullopt;
        }
    }
    return name.empty() ? std::nullopt : std::optional(std::move(name));
}

CycleChannels::CycleChannels(std::shared_ptr<const SharedFolder> folder,
                             std::shared_ptr<SourceRoot> root, const Direction& direction,
                             Taken taken)
    : folder_(std::move(folder)), root_(std::move(root)), direction_(direction),
      taken_(std::move(taken)) {}

bool CycleChannels::read(platform::SteadyTime now, const Visit& visit) {
    const bool all = findDevices();
    for (Device& device : devices_) {
        for (Channel& channel : device.channels) {
            visit(channel.facts, channel.failing, channel.source->read(now));
        }
    }
    return all;
}

bool CycleChannels::findDevices() {
    std::erase_if(devices_, [&](const Device& device) {
        return presenceOf(device.stem) == Presence::NotThere;
    });
    triesLeft_ = kMaxTries;
    return folder_->look([&](const char* name) { return consider(name); });
}

bool CycleChannels::consider(std::string_view name) {
    if (!name.starts_with(direction_.prefix) || !name.ends_with(kCounts)) {
        return true;
    }
    name.remove_suffix(kCounts.size());
    const auto known = [&](const Device& device) { return device.stem == name; };
    if (std::any_of(devices_.begin(), devices_.end(), known)) {
        return true;
    }
    auto driver = cycleDeviceName(name.substr(direction_.prefix.size()));
    if (!driver) {
        return true;
    }
    if (triesLeft_ == 0) {
        return false;
    }
    --triesLeft_;
    const Presence presence = presenceOf(std::string(name));
    if (presence == Presence::There && devices_.size() < kMaxDevices) {
        addDevice(std::string(name), std::move(*driver));
        return true;
    }
    return presence == Presence::NotThere;
}

CycleChannels::Presence CycleChannels::presenceOf(const std::string& stem) const {
    const Result<int> counts = folder_->open(stem + std::string(kCounts));
    if (counts.ok()) {
        ::close(counts.value());
        return Presence::There;
    }
    const Failure& failure = counts.failure();
    return meansAbsent(failure) || failure.code == std::errc::operation_not_permitted
               ? Presence::NotThere
               : Presence::Unknown;
}

void CycleChannels::addDevice(std::string stem, std::string driver) {
    Device device{std::move(stem), std::move(driver), 1, {}};
    const auto isLike = [&](const Device& each) {
        return each.number == device.number && inReports(each.driver) == inReports(device.driver);
    };
    while (std::any_of(devices_.begin(), devices_.end(), isLike)) {
        ++device.number;
    }
    addChannel(device, "Cycles", ".counts", "cycles");
    addChannel(device, "Missed cycles", ".counts", "missed");
    addChannel(device, "Wait", ".wait", nullptr);
    addChannel(device, "Busy", ".busy", nullptr);
    addChannel(device, "Cycle time", ".cycle", nullptr);
    devices_.push_back(std::move(device));
}

// A counter in that row, or a histogram.
void CycleChannels::addChannel(Device& device, const char* name, const char* suffix,
                               const char* row) {
    const std::string fileName = device.stem + suffix;
    const std::string path = (folder_->path() / fileName).native();
    DriverChannel names;
    names.group = direction_.group;
    names.driver = device.driver;
    names.name = device.number == 1 ? name : fmt::format("{} {}", name, device.number);
    Channel channel;
    if (row != nullptr) {
        names.source = fmt::format("field:{}:{}:2", path, row);
        channel.source = std::make_unique<CounterSource>(
            file(fileName), [place = FieldPlace{row, 2}](std::string_view text) {
                return parseField(text, place);
            });
    } else {
        names.format = ChannelFormat::Histogram;
        names.unit = "us";
        names.source = "histogram:" + path;
        channel.source = std::make_unique<BucketSource>(file(fileName), parseCycleBuckets);
    }
    if (!taken_(names)) {
        channel.facts = std::make_shared<const ChannelFacts>(ChannelFacts{std::move(names), 1});
        device.channels.push_back(std::move(channel));
    }
}

SampledFile CycleChannels::file(const std::string& name) const {
    return {folder_->path() / name, root_->descriptors,
            [folder = folder_, name] { return folder->open(name); }};
}

} // namespace halyard::linux_
