#include "linux/trace/TraceInstance.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

#include "linux/system/SmallFile.h"
#include "linux/trace/Tracefs.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

// Two million events in a burst pass through 4 MiB per processor when it is read
// every 10 ms; machines of many processors get less for each.
constexpr unsigned kBufferKiB = 4096;
constexpr unsigned kLeastBufferKiB = 256;
constexpr unsigned kAllBuffersKiB = 64 * 1024;

#if defined(__x86_64__)
constexpr const char* kArguments = "code=%di:u32 a1=%si:u64 a2=%dx:u64 a3=%cx:u64 a4=%r8:u64";
#else
constexpr const char* kArguments = "code=%x0:u32 a1=%x1:u64 a2=%x2:u64 a3=%x3:u64 a4=%x4:u64";
#endif

std::string readText(const fs::path& file) {
    auto read = readSmallFile(file, 64 * 1024);
    return read.ok() ? std::move(read).value() : std::string();
}

// The number that follows `label` in `text`; 0 when there is none.
std::uint64_t numberAfter(std::string_view text, std::string_view label) {
    const std::size_t at = text.find(label);
    std::uint64_t number = 0;
    if (at != std::string_view::npos) {
        text.remove_prefix(at + label.size());
        text.remove_prefix(std::min(text.find_first_not_of(" \t"), text.size()));
        std::from_chars(text.data(), text.data() + text.size(), number);
    }
    return number;
}

// "field:u32 code;	offset:16;	size:4;	signed:0;"
std::size_t offsetOfField(std::string_view format, std::string_view name) {
    const std::size_t at = format.find(fmt::format(" {};", name));
    return at != std::string_view::npos ? numberAfter(format.substr(at), "offset:") : 0;
}

unsigned bufferKiB() {
    const unsigned processors = std::max(std::thread::hardware_concurrency(), 1U);
    return std::clamp(kAllBuffersKiB / processors, kLeastBufferKiB, kBufferKiB);
}

} // namespace

TraceInstance::TraceInstance(fs::path tracefs)
    : tracefs_(std::move(tracefs)), name_(uniqueTraceName()),
      directory_(tracefs_ / "instances" / name_) {}

TraceInstance::~TraceInstance() {
    disable();
    if (created_) {
        (void)::rmdir(directory_.c_str());
    }
    for (const std::string& probe : probes_) {
        (void)writeTracefs(tracefs_ / "uprobe_events", fmt::format("-:{}/{}\n", name_, probe),
                           true);
    }
}

Result<void> TraceInstance::create() {
    if (::mkdir(directory_.c_str(), S_IRWXU) != 0) {
        return Failure::ofErrno(directory_.string());
    }
    created_ = true;
    const std::pair<const char*, std::string> settings[] = {
        {"tracing_on", "0"},
        {"trace_clock", "mono"},
        {"options/overwrite", "0"},
        {"buffer_size_kb", std::to_string(bufferKiB())},
    };
    for (const auto& [file, value] : settings) {
        if (auto written = writeTracefs(directory_ / file, value); !written.ok()) {
            return written;
        }
    }
    // Probes are defined there: that nobody may write to it is no probe's fault.
    if (auto writable = writeTracefs(tracefs_ / "uprobe_events", "", true); !writable.ok()) {
        return writable;
    }
    // Helps to tell the process of a thread that has ended; nothing depends on it.
    (void)writeTracefs(directory_ / "options/record-tgid", "1");
    return {};
}

Result<void> TraceInstance::record() {
    return writeTracefs(directory_ / "tracing_on", "1");
}

Result<void> TraceInstance::probe(const MarkLibraries::Library& library, std::uint32_t first,
                                  std::uint32_t last) {
    const std::string probe = fmt::format("mark{}", probes_.size());
    auto result = writeTracefs(tracefs_ / "uprobe_events",
                               fmt::format("p:{}/{} {}:0x{:x} {}\n", name_, probe,
                                           library.file->path(), library.offset, kArguments),
                               true);
    if (!result.ok()) {
        return result;
    }
    probes_.push_back(probe); // Removed with the others, also when it cannot be used.
    const fs::path event = directory_ / "events" / name_ / probe;
    result = readFormat(event);
    if (result.ok()) {
        result =
            writeTracefs(event / "filter", fmt::format("code >= {} && code <= {}", first, last));
    }
    return result.ok() ? writeTracefs(event / "enable", "1") : result;
}

Result<void> TraceInstance::readFormat(const fs::path& event) {
    const std::string format = readText(event / "format");
    const auto id = static_cast<std::uint16_t>(numberAfter(format, "ID:"));
    layout_.code = offsetOfField(format, "code");
    layout_.size = layout_.code + sizeof(std::uint32_t);
    for (std::size_t i = 0; i < 4; ++i) {
        layout_.arguments[i] = offsetOfField(format, fmt::format("a{}", i + 1));
        layout_.size = std::max(layout_.size, layout_.arguments[i] + sizeof(std::uint64_t));
    }
    if (id == 0 || layout_.code == 0) {
        return Failure{std::errc::not_supported, (event / "format").string()};
    }
    eventIDs_.push_back(id);
    return {};
}

void TraceInstance::disable() {
    for (const std::string& probe : probes_) {
        (void)writeTracefs(directory_ / "events" / name_ / probe / "enable", "0");
    }
    if (created_) {
        (void)writeTracefs(directory_ / "tracing_on", "0");
    }
}

bool TraceInstance::isOurs(std::uint16_t eventID) const {
    return std::find(eventIDs_.begin(), eventIDs_.end(), eventID) != eventIDs_.end();
}

std::uint64_t TraceInstance::eventsLost() const {
    std::uint64_t lost = 0;
    std::error_code error;
    for (const auto& processor : fs::directory_iterator(directory_ / "per_cpu", error)) {
        const std::string stats = readText(processor.path() / "stats");
        lost += numberAfter(stats, "\noverrun:") + numberAfter(stats, "\ncommit overrun:") +
                numberAfter(stats, "\ndropped events:");
    }
    return lost;
}

} // namespace halyard::linux_
