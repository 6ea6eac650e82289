#include "linux/drivers/ChannelSources.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>

#include "linux/system/SmallFile.h"

namespace halyard::linux_ {
namespace {

constexpr std::size_t kMaxInterruptLines = 64;

// One for each thread: nothing of the text outlives the read of a source.
std::string& scratch() {
    static thread_local std::string text;
    return text;
}

Reading missing(const SampledFile& file, const Failure& failure) {
    Reading reading;
    reading.status = meansAbsent(failure) ? ReadStatus::Absent : ReadStatus::Failed;
    reading.fault = fmt::format("{}: {}", file.path().native(), failure.message());
    return reading;
}

Reading malformed(const SampledFile& file) {
    Reading reading;
    reading.fault = fmt::format("{}: not in the expected format", file.path().native());
    return reading;
}

Reading simple(std::uint64_t bits) {
    Reading reading;
    reading.status = ReadStatus::Read;
    reading.numbers.push_back(bits);
    return reading;
}

// Keeps the shape that there is, if it still fits.
void settle(ReadingShapeRef& shape, ReadingShape now) {
    if (shape == nullptr || *shape != now) {
        shape = std::make_shared<const ReadingShape>(std::move(now));
    }
}

// Adds the file's one number to the reading's at `place`; false when there is
// none, and then the reading says why.
bool addNumber(SampledFile& file, Reading& reading, std::size_t place) {
    std::string& text = scratch();
    if (const auto result = file.read(text); !result.ok()) {
        reading = missing(file, result.failure());
        return false;
    }
    const auto value = parseInteger(text);
    if (!value || *value < 0) {
        reading = malformed(file);
        return false;
    }
    reading.numbers[place] += static_cast<std::uint64_t>(*value);
    return true;
}

} // namespace

Reading CounterSource::read(platform::SteadyTime) {
    std::string& text = scratch();
    if (const auto result = file_.read(text); !result.ok()) {
        return missing(file_, result.failure());
    }
    const auto value = parse_(text);
    return value ? simple(static_cast<std::uint64_t>(*value)) : malformed(file_);
}

namespace {

// "snd_hda,nvme" holds two actions.
bool hasAction(std::string_view actions, std::string_view action) {
    while (!actions.empty()) {
        const std::size_t comma = std::min(actions.find_first_of(",\n"), actions.size());
        if (actions.substr(0, comma) == action) {
            return true;
        }
        actions.remove_prefix(std::min(comma + 1, actions.size()));
    }
    return false;
}

} // namespace

InterruptSource::InterruptSource(const std::string& action, SourceRoot& root) {
    std::error_code ignored;
    std::filesystem::directory_iterator lines(root.resolve("/sys/kernel/irq"), ignored);
    for (; lines != std::filesystem::directory_iterator(); lines.increment(ignored)) {
        const auto actions = readSmallFile(lines->path() / "actions", kMaxSampledFile);
        if (actions.ok() && hasAction(actions.value(), action) &&
            counts_.size() < kMaxInterruptLines) {
            counts_.emplace_back(lines->path() / "per_cpu_count", root.descriptors);
        }
    }
}

Reading InterruptSource::read(platform::SteadyTime) {
    if (counts_.empty()) {
        Reading reading;
        reading.status = ReadStatus::Absent;
        reading.fault = "no interrupt has this action";
        return reading;
    }
    std::uint64_t sum = 0;
    std::string& text = scratch();
    for (SampledFile& file : counts_) {
        if (const auto result = file.read(text); !result.ok()) {
            return missing(file, result.failure());
        }
        const auto count = parsePerCpuCount(text);
        if (!count) {
            return malformed(file);
        }
        sum += *count;
    }
    return simple(sum);
}

namespace {

// The directories "state0", "state1", ... in that order.
std::vector<std::filesystem::path> stateDirectories(const std::filesystem::path& parent) {
    constexpr std::string_view kPrefix = "state";
    std::vector<std::pair<unsigned, std::filesystem::path>> found;
    std::error_code ignored;
    std::filesystem::directory_iterator entries(parent, ignored);
    for (; entries != std::filesystem::directory_iterator(); entries.increment(ignored)) {
        const std::string name = entries->path().filename().native();
        unsigned number = 0;
        const char* const end = name.data() + name.size();
        if (name.starts_with(kPrefix) && name.size() > kPrefix.size() &&
            std::from_chars(name.data() + kPrefix.size(), end, number).ptr == end &&
            found.size() < kMaxSourceStates) {
            found.emplace_back(number, entries->path());
        }
    }
    std::sort(found.begin(), found.end());
    std::vector<std::filesystem::path> paths;
    for (auto& [number, path] : found) {
        paths.push_back(std::move(path));
    }
    return paths;
}

std::string firstLine(const std::filesystem::path& path, std::string otherwise) {
    const auto read = readSmallFile(path, kMaxSampledFile);
    return read.ok() ? read.value().substr(0, read.value().find('\n')) : std::move(otherwise);
}

} // namespace

bool CpuIdleSource::findStates() {
    ReadingShape shape;
    for (const auto& state : stateDirectories(directory_)) {
        std::string name = firstLine(state / "name", state.filename().native());
        const auto same = std::find(shape.states.begin(), shape.states.end(), name);
        states_.push_back({SampledFile(state / "time", root_.descriptors),
                           SampledFile(state / "usage", root_.descriptors),
                           2 * static_cast<std::size_t>(same - shape.states.begin())});
        if (same == shape.states.end()) {
            shape.states.push_back(std::move(name));
        }
    }
    settle(shape_, std::move(shape));
    return !states_.empty();
}

Reading CpuIdleSource::read(platform::SteadyTime) {
    Reading reading;
    if (states_.empty() && !findStates()) {
        reading.status = ReadStatus::Absent;
        reading.fault = fmt::format("{}: no idle states", directory_.native());
        return reading;
    }
    reading.numbers.resize(2 * shape_->states.size());
    for (State& state : states_) {
        if (!addNumber(state.time, reading, state.place) ||
            !addNumber(state.usage, reading, state.place + 1)) {
            states_.clear(); // Others may be there next time.
            return reading;
        }
    }
    reading.status = ReadStatus::Read;
    reading.shape = shape_;
    return reading;
}

RuntimePowerSource::RuntimePowerSource(const std::filesystem::path& directory, SourceRoot& root)
    : active_((directory.filename() == "power" ? directory : directory / "power") /
                  "runtime_active_time",
              root.descriptors),
      suspended_(active_.path().parent_path() / "runtime_suspended_time", root.descriptors),
      shape_(std::make_shared<const ReadingShape>(ReadingShape{{"active", "suspended"}, {}})) {}

Reading RuntimePowerSource::read(platform::SteadyTime) {
    Reading reading;
    reading.numbers.resize(4);
    if (!addNumber(active_, reading, 0) || !addNumber(suspended_, reading, 2)) {
        return reading;
    }
    reading.status = ReadStatus::Read;
    reading.shape = shape_;
    return reading;
}

// The table of transitions is left out when it is too large for its file, and by
// kernels that keep none.
void StateTableSource::addTransitions(SourceStates& states) {
    std::string& text = scratch();
    if (!transitions_ || !transitions_->read(text).ok()) {
        return;
    }
    const auto table = parseTransitionTable(text);
    if (!table) {
        return;
    }
    for (SourceState& state : states) {
        for (const SourceState& row : *table) {
            if (row.name == state.name) {
                state.transitions = row.transitions;
            }
        }
    }
}

Reading StateTableSource::read(platform::SteadyTime) {
    std::string& text = scratch();
    if (const auto result = file_.read(text); !result.ok()) {
        return missing(file_, result.failure());
    }
    auto states = parse_(text);
    if (!states) {
        return malformed(file_);
    }
    addTransitions(*states);
    Reading reading;
    ReadingShape shape;
    for (SourceState& state : *states) {
        reading.numbers.push_back(state.residency);
        reading.numbers.push_back(state.transitions);
        shape.states.push_back(std::move(state.name));
    }
    settle(shape_, std::move(shape));
    reading.shape = shape_;
    reading.status = ReadStatus::Read;
    return reading;
}

Reading BucketSource::read(platform::SteadyTime) {
    std::string& text = scratch();
    if (const auto result = file_.read(text); !result.ok()) {
        return missing(file_, result.failure());
    }
    const auto buckets = parse_(text);
    if (!buckets) {
        return malformed(file_);
    }
    Reading reading;
    ReadingShape shape;
    for (const SourceBucket& bucket : *buckets) {
        reading.numbers.push_back(bucket.hits);
        shape.bounds.emplace_back(bucket.lower, bucket.upper);
    }
    settle(shape_, std::move(shape));
    reading.shape = shape_;
    reading.status = ReadStatus::Read;
    return reading;
}

namespace {

constexpr std::string_view kRunning = "RUNNING";
constexpr const char* kPcmStates[] = {"CLOSED", "OPEN",     "SETUP",  "PREPARED",  "RUNNING",
                                      "XRUN",   "DRAINING", "PAUSED", "SUSPENDED", "DISCONNECTED"};
constexpr std::size_t kPcmStateCount = std::size(kPcmStates);

ReadingShapeRef pcmShape() {
    static const auto shape = std::make_shared<const ReadingShape>(
        ReadingShape{{std::begin(kPcmStates), std::end(kPcmStates)}, {}});
    return shape;
}

// Where a state's residency stands in a reading; none for one that ALSA does not
// have.
std::optional<std::size_t> placeOf(const std::string& state) {
    const auto* const at = std::find(std::begin(kPcmStates), std::end(kPcmStates), state);
    return at != std::end(kPcmStates)
               ? std::optional(2 * static_cast<std::size_t>(at - std::begin(kPcmStates)))
               : std::nullopt;
}

std::uint64_t microseconds(std::chrono::nanoseconds time) {
    return static_cast<std::uint64_t>(
        std::chrono::duration_cast<std::chrono::microseconds>(time).count());
}

std::uint64_t framesOf(const PcmStatus& status) {
    return static_cast<std::uint64_t>(std::max<std::int64_t>(status.frames.value_or(0), 0));
}

} // namespace

PcmSource::PcmSource(SampledFile status, What what)
    : file_(std::move(status)), what_(what), shape_(pcmShape()) {}

// A stream that was only paused goes on counting where it was. One that had to be
// prepared again, as after an xrun, counts from 0. Where both may have been, the
// lesser is taken.
std::uint64_t PcmSource::framesSinceLast(const PcmStatus& status) const {
    const std::uint64_t frames = framesOf(status);
    const std::uint64_t before = framesOf(*last_);
    const bool preparedAgain = status.state == kRunning && status.triggered != last_->triggered &&
                               last_->state != kRunning && last_->state != "PAUSED" &&
                               last_->state != "SUSPENDED";
    const bool anew = preparedAgain || status.owner != last_->owner || frames < before;
    return anew ? frames : frames - before;
}

void PcmSource::addResidency(const PcmStatus& status, bool restarted, platform::SteadyTime now) {
    const auto before = placeOf(last_->state);
    const auto after = placeOf(status.state);
    const bool entered = restarted || status.state != last_->state;
    std::chrono::nanoseconds elapsed = std::max(now - lastTime_, std::chrono::nanoseconds(0));
    if (after && entered) {
        ++seen_.residencies[*after + 1];
        if (status.state == kRunning && status.triggered && status.stamped) {
            const auto running = std::clamp(*status.stamped - *status.triggered,
                                            std::chrono::nanoseconds(0), elapsed);
            seen_.residencies[*after] += microseconds(running);
            elapsed -= running;
        }
    }
    if (before) {
        seen_.residencies[*before] += microseconds(elapsed);
    }
}

void PcmSource::advance(const PcmStatus& status, platform::SteadyTime now) {
    const bool restarted = status.state == kRunning && status.owner == last_->owner &&
                           last_->triggered && status.triggered != last_->triggered;
    seen_.restarts += restarted ? 1 : 0;
    seen_.xruns += status.state == "XRUN" && last_->state != "XRUN" ? 1 : 0;
    seen_.frames += framesSinceLast(status);
    addResidency(status, restarted, now);
}

Reading PcmSource::read(platform::SteadyTime now) {
    std::string& text = scratch();
    if (const auto result = file_.read(text); !result.ok()) {
        if (meansAbsent(result.failure())) { // And its history with it.
            last_.reset();
        }
        return missing(file_, result.failure());
    }
    auto status = parsePcmStatus(text);
    if (!status) {
        return malformed(file_);
    }
    if (last_) {
        advance(*status, now);
    } else {
        seen_ = Seen{framesOf(*status), 0, 0, std::vector<std::uint64_t>(2 * kPcmStateCount)};
    }
    last_ = std::move(*status);
    lastTime_ = now;
    switch (what_) {
    case What::Frames:
        return simple(seen_.frames);
    case What::Xruns:
        return simple(seen_.xruns);
    case What::Restarts:
        return simple(seen_.restarts);
    case What::States:
        break;
    }
    Reading reading;
    reading.status = ReadStatus::Read;
    reading.shape = shape_;
    reading.numbers = seen_.residencies;
    return reading;
}

} // namespace halyard::linux_
