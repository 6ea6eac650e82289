#include "GlitchTesting.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <ctime>
#include <fcntl.h>
#include <fstream>
#include <poll.h>
#include <sched.h>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <unistd.h>

namespace halyard::testing {

namespace fs = std::filesystem;
using namespace std::chrono_literals;

namespace {

constexpr auto kPatience = 30s;

std::int64_t read(clockid_t clock) {
    timespec time{};
    clock_gettime(clock, &time);
    return time.tv_sec * 1'000'000'000 + time.tv_nsec;
}

std::array<int, 2> pipeEnds() {
    std::array<int, 2> ends{};
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe2");
    }
    return ends;
}

// 0 for a key that the line does not have.
std::int64_t number(std::string_view line, const std::string& key) {
    const std::string label = '"' + key + "\":";
    const auto found = line.find(label);
    std::int64_t value = 0;
    if (found != std::string_view::npos) {
        std::from_chars(line.data() + found + label.size(), line.data() + line.size(), value);
    }
    return value;
}

} // namespace

// ---- The player

GlitchPlayer::GlitchPlayer(const std::vector<std::string>& options) {
    signal(SIGPIPE, SIG_IGN); // one that died is told by its answers
    std::vector<std::string> arguments{HALYARD_GLITCH_PLAYER};
    arguments.insert(arguments.end(), options.begin(), options.end());
    const auto commands = pipeEnds();
    const auto answers = pipeEnds();
    commands_ = commands[1];
    answers_ = answers[0];
    process_ = Child(arguments, "", {commands[0], answers[1]});
    close(commands[0]);
    close(answers[1]);
    const std::string introduction = line();
    node_ = static_cast<std::uint32_t>(number(introduction, "node"));
    understand(introduction);
}

GlitchPlayer::~GlitchPlayer() {
    close(commands_);
    close(answers_);
}

bool GlitchPlayer::canFault() {
    return geteuid() == 0 && access("/dev/fuse", R_OK | W_OK) == 0;
}

Episode GlitchPlayer::command(const std::string& text) {
    send(text);
    return answer();
}

Episode GlitchPlayer::answer() {
    return understand(line());
}

void GlitchPlayer::send(const std::string& text) const {
    const std::string command = text + '\n';
    if (write(commands_, command.data(), command.size()) != static_cast<ssize_t>(command.size())) {
        throw std::system_error(errno, std::generic_category(), "the player is gone");
    }
}

std::optional<Episode> GlitchPlayer::answered() {
    const auto line = lineWithin(0ms);
    return line ? std::optional(understand(*line)) : std::nullopt;
}

std::string GlitchPlayer::line() {
    const auto line = lineWithin(kPatience);
    if (!line) {
        throw std::runtime_error("the player does not answer");
    }
    return *line;
}

std::optional<std::string> GlitchPlayer::lineWithin(std::chrono::milliseconds time) {
    for (auto end = read_.find('\n'); end == std::string::npos; end = read_.find('\n')) {
        pollfd source{answers_, POLLIN, 0};
        if (poll(&source, 1, static_cast<int>(time.count())) <= 0) {
            return std::nullopt;
        }
        std::array<char, 1024> bytes{};
        const ssize_t count = ::read(answers_, bytes.data(), bytes.size());
        if (count <= 0) {
            throw std::runtime_error("the player is gone");
        }
        read_.append(bytes.data(), static_cast<std::size_t>(count));
    }
    const auto end = read_.find('\n');
    const std::string line = read_.substr(0, end);
    read_.erase(0, end + 1);
    return line;
}

Episode GlitchPlayer::understand(const std::string& line) {
    dataThread_ = static_cast<pid_t>(number(line, "tid"));
    return {.monotonicBefore = number(line, "monotonic_before"),
            .monotonicAfter = number(line, "monotonic_after"),
            .realtimeBefore = number(line, "realtime_before"),
            .realtimeAfter = number(line, "realtime_after")};
}

// ---- Control groups

std::unique_ptr<FreezableGroup> FreezableGroup::make(Version version) {
    const std::vector<fs::path> roots =
        version == Version::One ? std::vector<fs::path>{"/sys/fs/cgroup/freezer"}
                                : std::vector<fs::path>{"/sys/fs/cgroup", "/sys/fs/cgroup/unified"};
    const auto root = std::find_if(roots.begin(), roots.end(), [version](const fs::path& path) {
        const bool unified = fs::exists(path / "cgroup.controllers");
        return fs::exists(path / "cgroup.procs") && unified == (version == Version::Two);
    });
    if (root == roots.end()) {
        return nullptr;
    }
    std::string name = (*root / "halyard-XXXXXX").native();
    if (mkdtemp(name.data()) == nullptr) {
        return nullptr;
    }
    return std::unique_ptr<FreezableGroup>(new FreezableGroup(version, name));
}

FreezableGroup::~FreezableGroup() {
    set(false);
    std::ifstream processes(path_ / "cgroup.procs");
    for (std::string process; processes >> process;) {
        std::ofstream(path_.parent_path() / "cgroup.procs") << process << std::flush;
    }
    rmdir(path_.c_str());
}

void FreezableGroup::add(pid_t process) {
    std::ofstream file(path_ / "cgroup.procs");
    if (!(file << process << std::flush)) {
        throw std::runtime_error("the process does not go into the control group");
    }
}

void FreezableGroup::set(bool frozen) {
    if (version_ == Version::One) {
        std::ofstream(path_ / "freezer.state") << (frozen ? "FROZEN" : "THAWED") << std::flush;
    } else {
        std::ofstream(path_ / "cgroup.freeze") << (frozen ? '1' : '0') << std::flush;
    }
}

bool FreezableGroup::frozen() const {
    std::ifstream file(path_ / (version_ == Version::One ? "freezer.state" : "cgroup.events"));
    const std::string text(std::istreambuf_iterator<char>(file), {});
    return text.find("FROZEN") != std::string::npos || text.find("frozen 1") != std::string::npos;
}

void FreezableGroup::freeze() {
    set(true);
    while (!frozen()) {
        std::this_thread::yield();
    }
}

void FreezableGroup::thaw() {
    set(false);
    while (frozen()) {
        std::this_thread::yield();
    }
}

// ---- Processors

namespace {

constexpr sched_param kAbovePipeWire{.sched_priority = 95};

} // namespace

bool pin(pid_t thread, int processor) {
    cpu_set_t processors{};
    CPU_SET(static_cast<std::size_t>(processor), &processors);
    return sched_setaffinity(thread, sizeof processors, &processors) == 0;
}

bool ProcessorHog::allowed() {
    bool allowed = false;
    std::thread([&allowed] {
        allowed = sched_setscheduler(0, SCHED_FIFO, &kAbovePipeWire) == 0;
    }).join();
    return allowed && std::thread::hardware_concurrency() > 1;
}

ProcessorHog::ProcessorHog(int processor, std::chrono::milliseconds time)
    : thread_([this, processor, time] {
          if (!pin(0, processor) || sched_setscheduler(0, SCHED_FIFO, &kAbovePipeWire) != 0) {
              return;
          }
          episode_.realtimeBefore = read(CLOCK_REALTIME);
          episode_.monotonicBefore = read(CLOCK_MONOTONIC);
          const auto end = episode_.monotonicBefore + std::chrono::nanoseconds(time).count();
          while (read(CLOCK_MONOTONIC) < end) {
          }
          episode_.monotonicAfter = read(CLOCK_MONOTONIC);
          episode_.realtimeAfter = read(CLOCK_REALTIME);
      }) {}

ProcessorHog::~ProcessorHog() {
    if (thread_.joinable()) {
        thread_.join();
    }
}

Episode ProcessorHog::wait() {
    thread_.join();
    return episode_;
}

} // namespace halyard::testing
