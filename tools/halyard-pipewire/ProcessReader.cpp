#include "ProcessReader.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <csignal>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <functional>
#include <memory>
#include <sched.h>
#include <string_view>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace halyard::pipewire {

namespace {

namespace fs = std::filesystem;

constexpr int kReadOnly = O_RDONLY | O_CLOEXEC;

Descriptor openAt(const Descriptor& folder, const std::string& name) {
    return Descriptor(folder ? ::openat(folder.get(), name.c_str(), kReadOnly) : -1);
}

// What a file of the kernel's says, up to 4 KiB; nothing when it cannot be read.
std::string_view readAll(const Descriptor& file, std::array<char, 4096>& buffer) {
    const ssize_t size = file ? ::pread(file.get(), buffer.data(), buffer.size(), 0) : -1;
    return {buffer.data(), size > 0 ? static_cast<std::size_t>(size) : 0};
}

// The words of a line, without those that `skip`.
std::vector<std::string_view> words(std::string_view text) {
    std::vector<std::string_view> result;
    while (!text.empty() && result.size() < 64) {
        const std::size_t end = text.find_first_of(" \n");
        if (end != 0) {
            result.push_back(text.substr(0, end));
        }
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    }
    return result;
}

template <class Number>
std::optional<Number> number(const std::vector<std::string_view>& from, std::size_t place) {
    Number value{};
    if (place >= from.size()) {
        return std::nullopt;
    }
    const std::string_view word = from[place];
    const auto result = std::from_chars(word.data(), word.data() + word.size(), value);
    return result.ec == std::errc() ? std::optional(value) : std::nullopt;
}

// The fields of a "stat" file behind the program's name, which may hold anything:
// the state is the first.
std::vector<std::string_view> statFields(std::string_view text) {
    const std::size_t name = text.rfind(')');
    return name == std::string_view::npos ? std::vector<std::string_view>()
                                          : words(text.substr(name + 1));
}

constexpr std::size_t kState = 0;
constexpr std::size_t kMajorFaults = 9;
constexpr std::size_t kPolicy = 38;
constexpr std::size_t kIoTicks = 39;
constexpr std::size_t kExitCode = 49;

// Threads that only work in the graph, by their names in PipeWire's releases.
bool isNamedForData(std::string_view comm) {
    return comm.starts_with("data-loop") || comm.starts_with("pw-data-loop");
}

struct Thread {
    std::string id;
    bool named = false;
    bool realTime = false;
    std::uint64_t slices = 0;
};

Thread lookAt(const Descriptor& process, const std::string& id) {
    std::array<char, 4096> buffer{};
    Thread thread{.id = id};
    const std::string folder = "task/" + id + "/";
    thread.named = isNamedForData(readAll(openAt(process, folder + "comm"), buffer));
    const auto policy =
        number<int>(statFields(readAll(openAt(process, folder + "stat"), buffer)), kPolicy);
    thread.realTime = policy == SCHED_FIFO || policy == SCHED_RR;
    thread.slices =
        number<std::uint64_t>(words(readAll(openAt(process, folder + "schedstat"), buffer)), 2)
            .value_or(0);
    return thread;
}

std::vector<Thread> threadsOf(const Descriptor& process) {
    std::vector<Thread> result;
    const int fd = process ? ::openat(process.get(), "task", kReadOnly | O_DIRECTORY) : -1;
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(fd >= 0 ? ::fdopendir(fd) : nullptr,
                                                     ::closedir);
    while (const dirent* const entry = folder ? ::readdir(folder.get()) : nullptr) {
        if (entry->d_name[0] != '.' && result.size() < ProcessReader::kMaxThreads) {
            result.push_back(lookAt(process, entry->d_name));
        }
    }
    return result;
}

// Linux 6.15 keeps it for those who hold a handle; <linux/pidfd.h> of older headers
// does not know it.
struct PidInfo {
    std::uint64_t mask = 0;
    std::uint64_t controlGroup = 0;
    std::uint32_t ids[11] = {};
    std::int32_t exitCode = 0;
    std::uint32_t rest[2] = {};
};
constexpr unsigned long kGetInfo = _IOWR(0xFF, 11, PidInfo);
constexpr std::uint64_t kInfoExit = 1U << 3;

std::optional<int> exitStatus(const Descriptor& handle) {
    PidInfo info{.mask = kInfoExit};
    if (!handle || ::ioctl(handle.get(), kGetInfo, &info) != 0 || (info.mask & kInfoExit) == 0) {
        return std::nullopt;
    }
    return info.exitCode;
}

Descriptor openHandle(pid_t process) {
    return Descriptor(static_cast<int>(::syscall(SYS_pidfd_open, process, 0)));
}

} // namespace

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
}

Descriptor::~Descriptor() {
    if (fd_ >= 0) {
        ::close(fd_);
    }
}

ProcessReader::ProcessReader(pid_t process, Places places)
    : places_(std::move(places)), handle_(openHandle(process)),
      folder_(
          ::open((places_.processes / std::to_string(process)).c_str(), kReadOnly | O_DIRECTORY)),
      processStat_(openAt(folder_, "stat")), groups_(openAt(folder_, "cgroup")) {}

void ProcessReader::openThread(const std::string& thread) {
    if (thread == thread_) {
        return;
    }
    threadStat_ = openAt(folder_, "task/" + thread + "/stat");
    threadTimes_ = openAt(folder_, "task/" + thread + "/schedstat");
    thread_ = threadStat_ ? thread : "";
}

void ProcessReader::beginSearch() {
    if (known_) {
        return;
    }
    candidates_.clear();
    const std::vector<Thread> threads = threadsOf(folder_);
    for (const Thread& thread : threads) {
        candidates_.emplace(thread.id, Candidate{thread.slices});
    }
    const auto takeOnly = [&](bool Thread::*kind) {
        const auto found = std::find_if(threads.begin(), threads.end(), std::mem_fn(kind));
        if (std::count_if(threads.begin(), threads.end(), std::mem_fn(kind)) != 1) {
            return false;
        }
        openThread(found->id);
        return !thread_.empty();
    };
    known_ = takeOnly(&Thread::named);
    if (!known_) {
        takeOnly(&Thread::realTime);
    }
}

bool ProcessReader::findThread(std::uint64_t wakeUps, int streams) {
    const auto expected = static_cast<double>(wakeUps);
    const Thread* best = nullptr;
    std::pair<int, double> bestRank;
    const std::vector<Thread> threads = known_ ? std::vector<Thread>() : threadsOf(folder_);
    for (const Thread& thread : threads) {
        const auto before = candidates_.find(thread.id);
        if (before == candidates_.end()) {
            continue;
        }
        const double woken = static_cast<double>(thread.slices - before->second.slices);
        const double off = std::abs(woken - expected);
        const int kind = thread.named ? 0 : thread.realTime ? 1 : 2;
        // One of others that was scheduled half as often, or twice, is not woken by cycles.
        const bool unlikely =
            kind == 2 && (woken < 0.5 * expected || woken > (streams + 0.5) * expected);
        if (woken < 1 || unlikely) {
            continue;
        }
        const std::pair rank(kind, off);
        if (best == nullptr || rank < bestRank) {
            best = &thread;
            bestRank = rank;
        }
    }
    if (best != nullptr) {
        openThread(best->id);
        known_ = !thread_.empty();
    }
    return known_;
}

bool ProcessReader::Ending::died() const {
    if (!status || !WIFSIGNALED(*status)) {
        return false;
    }
    const int signal = WTERMSIG(*status);
    return signal != SIGTERM && signal != SIGINT && signal != SIGHUP && signal != SIGQUIT;
}

ProcessReader::Ending ProcessReader::ending() const {
    std::array<char, 4096> buffer{};
    if (!processStat_) {
        return {};
    }
    const auto fields = statFields(readAll(processStat_, buffer));
    if (fields.empty()) {
        return {.gone = true, .status = exitStatus(handle_)};
    }
    const bool gone = fields[kState] == "Z" || fields[kState] == "X";
    return {.gone = gone, .status = gone ? number<int>(fields, kExitCode) : std::nullopt};
}

ThreadSample ProcessReader::sample(Nanoseconds now) {
    static const Nanoseconds kTick = 1'000'000'000 / ::sysconf(_SC_CLK_TCK);
    std::array<char, 4096> buffer{};
    ThreadSample sample{.at = now};
    const auto fields = statFields(readAll(threadStat_ ? threadStat_ : processStat_, buffer));
    if (!fields.empty() && !fields[kState].empty()) {
        sample.state = fields[kState][0];
    }
    if (threadStat_) {
        sample.majorFaults = number<std::uint64_t>(fields, kMajorFaults);
        // Zero for all threads where the kernel does not count it.
        const auto ticks = number<std::int64_t>(fields, kIoTicks);
        sample.ioDelay = ticks ? std::optional(*ticks * kTick) : std::nullopt;
        std::array<char, 4096> times{};
        const auto spent = words(readAll(threadTimes_, times));
        sample.cpu = number<Nanoseconds>(spent, 0);
        sample.delay = number<Nanoseconds>(spent, 1);
    }
    sample.frozen = frozen();
    return sample;
}

// A process may be moved to another group, and frozen there, at any time.
bool ProcessReader::frozen() {
    std::array<char, 4096> buffer{};
    const std::string_view groups = readAll(groups_, buffer);
    if (groups != knownGroups_) {
        knownGroups_ = groups;
        followGroup(knownGroups_);
    }
    if (readAll(freezerTwo_, buffer).find("frozen 1") != std::string_view::npos) {
        return true;
    }
    return readAll(freezerOne_, buffer).starts_with("FR"); // FROZEN, FREEZING
}

// Lines "7:freezer:/PATH" and "0::/PATH".
void ProcessReader::followGroup(const std::string& groups) {
    freezerOne_ = Descriptor();
    freezerTwo_ = Descriptor();
    std::string_view rest = groups;
    while (!rest.empty()) {
        const std::string_view line = rest.substr(0, rest.find('\n'));
        rest.remove_prefix(std::min(rest.size(), line.size() + 1));
        const std::size_t colon = line.find(':');
        const std::size_t second = line.find(":/", colon == std::string_view::npos ? 0 : colon);
        if (second == std::string_view::npos) {
            continue;
        }
        const std::string path(line.substr(second + 2));
        const std::string_view controllers = line.substr(colon + 1, second - colon - 1);
        const fs::path top = places_.controlGroups;
        if (line.starts_with("0::")) {
            for (const fs::path& root : {top, top / "unified"}) {
                if (!freezerTwo_) {
                    freezerTwo_ =
                        Descriptor(::open((root / path / "cgroup.events").c_str(), kReadOnly));
                }
            }
        } else if (controllers == "freezer") {
            freezerOne_ =
                Descriptor(::open((top / "freezer" / path / "freezer.state").c_str(), kReadOnly));
        }
    }
}

} // namespace halyard::pipewire
