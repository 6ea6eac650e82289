#include "linux/drivers/LinuxHWReport.h"

#include <algorithm>
#include <fmt/format.h>
#include <tuple>
#include <utility>

#include "linux/drivers/BuiltInChannels.h"
#include "linux/drivers/SourceKinds.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

const platform::HWReportError kInvalid{static_cast<std::int64_t>(std::errc::invalid_argument)};

std::string_view nameOf(ChannelFormat format) {
    return kChannelFormats[static_cast<std::size_t>(format)].first;
}

auto identity(const DriverChannel& names) {
    return std::tie(names.group, names.subgroup, names.driver, names.name);
}

bool isIn(const DriverChannel& names, const std::optional<std::string>& group,
          const std::optional<std::string>& subGroup) {
    return (!group || names.group == group) && (!subGroup || names.subgroup == subGroup);
}

std::string describe(const DriverChannel& names) {
    return fmt::format("{}-{} \"{}\"", names.group.value_or("(null)"),
                       names.subgroup.value_or("(null)"), names.name);
}

// A source keeps the root it resolves its paths in.
std::shared_ptr<ChannelSource> withRoot(std::unique_ptr<ChannelSource> source,
                                        const std::shared_ptr<SourceRoot>& root) {
    struct Both {
        std::shared_ptr<SourceRoot> root;
        std::unique_ptr<ChannelSource> source;
    };
    const auto both = std::make_shared<Both>(Both{root, std::move(source)});
    return {both, both->source.get()};
}

// Tells the log when a channel begins to fail, and when it no longer does.
void noteChange(const ChannelFacts& facts, bool& failing, bool fails, const Reading& reading) {
    if (std::exchange(failing, fails) == fails) {
        return;
    }
    if (fails) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "driver channel {} cannot be read: {}",
                       describe(facts.names), reading.fault);
    } else {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "driver channel {} can be read again",
                       describe(facts.names));
    }
}

} // namespace

LinuxHWReport::LinuxHWReport(const platform::Clock& clock,
                             const std::vector<DriverChannel>& configured, Options options)
    : clock_(clock), guarded_(options.patience) {
    root_->path = options.root;
    for (const DriverChannel& channel : builtInChannels(*root_)) {
        add(channel, false);
    }
    for (const DriverChannel& channel : configured) {
        add(channel, true);
    }
    addCycles(options);
}

void LinuxHWReport::addCycles(const Options& options) {
    if (options.cycles.empty()) {
        return;
    }
    const auto folder = std::make_shared<const SharedFolder>(options.cycles, options.trusts);
    if (!folder->isThere()) {
        return;
    }
    for (const CycleChannels::Direction& direction : CycleChannels::kDirections) {
        cycles_.emplace_back(folder, root_, direction,
                             [this](const DriverChannel& names) { return hasChannel(names); });
    }
}

bool LinuxHWReport::hasChannel(const DriverChannel& names) const {
    return std::any_of(channels_.begin(), channels_.end(), [&](const Channel& each) {
        return identity(each.facts->names) == identity(names);
    });
}

void LinuxHWReport::add(const DriverChannel& names, bool configured) {
    auto made = makeChannelSource(names.source, *root_);
    const SourceKind* const kind = findSourceKind(names.source);
    std::string fault;
    if (!made.ok()) {
        fault = made.failure().text;
    } else if (kind->format != names.format) {
        fault =
            fmt::format("gives the format {}, not {}", nameOf(kind->format), nameOf(names.format));
    }
    if (!fault.empty()) {
        HY_LOG_ERROR(HYReportingPlatformCategory,
                     "driver channel {} is left out: its source \"{}\" {}", describe(names),
                     names.source, fault);
        leftOut_.push_back(names);
        return;
    }
    Channel channel;
    channel.facts =
        std::make_shared<const ChannelFacts>(ChannelFacts{names, kind->residencyPerSecond});
    channel.source = withRoot(std::move(made).value(), root_);
    channel.configured = configured;
    const auto same = std::find_if(channels_.begin(), channels_.end(), [&](const Channel& each) {
        return identity(each.facts->names) == identity(names);
    });
    if (same != channels_.end()) {
        *same = std::move(channel);
    } else {
        channels_.push_back(std::move(channel));
    }
}

platform::HWReportResult<platform::HWReportChannelsRef>
LinuxHWReport::copyChannelsInGroup(const std::optional<std::string>& group,
                                   const std::optional<std::string>& subGroup) {
    auto list = std::make_shared<ChannelList>();
    for (std::size_t place = 0; place < channels_.size(); ++place) {
        if (isIn(channels_[place].facts->names, group, subGroup)) {
            list->channels.push_back(channels_[place].facts);
            list->places.push_back(place);
        }
    }
    for (std::size_t place = 0; place < cycles_.size(); ++place) {
        if (!subGroup && (!group || cycles_[place].group() == *group)) {
            list->cycles.push_back(place);
        }
    }
    const bool complete =
        std::none_of(leftOut_.begin(), leftOut_.end(),
                     [&](const DriverChannel& names) { return isIn(names, group, subGroup); });
    return {list, complete ? std::nullopt : std::optional(kInvalid)};
}

std::int64_t LinuxHWReport::getChannelCount(const platform::HWReportChannels& channels) const {
    const auto* const list = dynamic_cast<const ChannelList*>(&channels);
    return list != nullptr ? static_cast<std::int64_t>(list->channels.size() + list->cycles.size())
                           : 0;
}

platform::HWReportSubscribed
LinuxHWReport::createSubscription(const platform::HWReportChannels& channels) {
    const auto* const list = dynamic_cast<const ChannelList*>(&channels);
    if (list == nullptr) {
        return {};
    }
    Subscription& subscription = subscriptions_.emplace_back();
    subscription.list = std::make_shared<ChannelList>(*list);
    return {&subscription, subscription.list};
}

// In the order in which they stand in the list.
std::vector<Reading> LinuxHWReport::readConfigured(const ChannelList& list,
                                                   platform::SteadyTime now) {
    std::vector<std::shared_ptr<ChannelSource>> sources;
    for (const std::size_t place : list.places) {
        if (channels_[place].configured) {
            sources.push_back(channels_[place].source);
        }
    }
    return sources.empty() ? std::vector<Reading>() : guarded_.read(sources, now);
}

platform::HWReportResult<platform::HWReportSamplesRef>
LinuxHWReport::createSamples(platform::HWReportSubscription* subscription,
                             const platform::HWReportChannels* channels) {
    const auto* const own = dynamic_cast<const Subscription*>(subscription);
    if (own == nullptr || own->list.get() != channels) {
        return {nullptr, kInvalid};
    }
    const platform::SteadyTime now = clock_.steadyTime();
    auto configured = readConfigured(*own->list, now);
    auto samples = std::make_shared<SampleSet>(own->list, now);
    std::size_t next = 0;
    for (const std::size_t place : own->list->places) {
        Channel& channel = channels_[place];
        const Reading reading =
            channel.configured ? std::move(configured[next++]) : channel.source->read(now);
        noteChange(*channel.facts, channel.failing, reading.status != ReadStatus::Read, reading);
        samples->add(reading);
    }
    sampleCycles(*own->list, now, *samples);
    return {samples, std::nullopt};
}

void LinuxHWReport::sampleCycles(const ChannelList& list, platform::SteadyTime now,
                                 SampleSet& samples) {
    for (const std::size_t place : list.cycles) {
        const bool all = cycles_[place].read(
            now, [&](const ChannelFactsRef& facts, bool& failing, const Reading& reading) {
                // A device may come and go, and need not have all of its files.
                noteChange(*facts, failing, reading.status == ReadStatus::Failed, reading);
                samples.addFound(facts, reading);
            });
        if (!all) {
            samples.setCurtailed();
        }
    }
}

platform::HWReportResult<platform::HWReportSamplesRef>
LinuxHWReport::createSamplesDelta(const platform::HWReportSamples* previous,
                                  const platform::HWReportSamples& current) {
    const auto* const after = dynamic_cast<const SampleSet*>(&current);
    const auto* const before = dynamic_cast<const SampleSet*>(previous);
    if (after == nullptr ||
        (previous != nullptr && (before == nullptr || before->list() != after->list()))) {
        return {nullptr, kInvalid};
    }
    if (before == nullptr) {
        return {std::make_shared<SampleSet>(after->list(), clock_.steadyTime()), std::nullopt};
    }
    return {after->since(*before), std::nullopt};
}

void LinuxHWReport::iterate(
    const platform::HWReportSamples& samples,
    const std::function<int(const platform::HWReportChannel&)>& callback) const {
    if (const auto* const set = dynamic_cast<const SampleSet*>(&samples)) {
        set->iterate(callback);
    }
}

} // namespace halyard::linux_
