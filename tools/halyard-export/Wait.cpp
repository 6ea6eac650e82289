#include "Wait.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <fmt/format.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace halyard::exporting {
namespace {

constexpr double kLongest = 60;
constexpr const char* kDropIns = "halyard.d";
constexpr std::size_t kMostFiles = 256;

std::string signatureOf(const std::filesystem::path& path) {
    struct stat facts {};
    if (::stat(path.c_str(), &facts) != 0) {
        return "-";
    }
    return fmt::format("{}:{}:{}:{}", facts.st_ino, facts.st_size, facts.st_mtim.tv_sec,
                       facts.st_mtim.tv_nsec);
}

} // namespace

std::string configurationSignature(const std::filesystem::path& directory) {
    std::string signature = signatureOf(directory / "halyard.toml");
    std::vector<std::string> files;
    std::error_code none;
    for (std::filesystem::directory_iterator at(directory / kDropIns, none), end;
         !none && at != end && files.size() < kMostFiles; at.increment(none)) {
        files.push_back(at->path().filename().native() + "=" + signatureOf(at->path()));
    }
    std::sort(files.begin(), files.end());
    for (const std::string& file : files) {
        signature += "|" + file;
    }
    return signature;
}

Wait::Wait(std::filesystem::path state, std::filesystem::path configuration)
    : state_(std::move(state)), configuration_(std::move(configuration)),
      storeEvents_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)),
      configurationEvents_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
    sigset_t ends;
    sigemptyset(&ends);
    sigaddset(&ends, SIGTERM);
    sigaddset(&ends, SIGINT);
    (void)::sigprocmask(SIG_BLOCK, &ends, nullptr);
    signals_ = ::signalfd(-1, &ends, SFD_CLOEXEC | SFD_NONBLOCK);
    watch();
}

Wait::~Wait() {
    for (const int descriptor : {storeEvents_, configurationEvents_, signals_}) {
        if (descriptor >= 0) {
            ::close(descriptor);
        }
    }
}

// The same watch twice is one.
void Wait::watch() {
    constexpr std::uint32_t kChanges =
        IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_CREATE;
    (void)::inotify_add_watch(storeEvents_, state_.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO);
    (void)::inotify_add_watch(configurationEvents_, configuration_.c_str(), kChanges);
    (void)::inotify_add_watch(configurationEvents_, (configuration_ / kDropIns).c_str(), kChanges);
}

bool Wait::drain(int descriptor) {
    std::array<char, 4096> room{};
    bool any = false;
    while (::read(descriptor, room.data(), room.size()) > 0) {
        any = true;
    }
    return any;
}

bool Wait::isEnded() {
    ended_ = drain(signals_) || ended_;
    return ended_;
}

Wait::Woken Wait::until(double seconds, bool watchesStore) {
    watch();
    const double capped = std::clamp(seconds, 0.0, kLongest);
    std::array<pollfd, 3> events{{{signals_, POLLIN, 0},
                                  {configurationEvents_, POLLIN, 0},
                                  {watchesStore ? storeEvents_ : -1, POLLIN, 0}}};
    (void)::poll(events.data(), events.size(), static_cast<int>(std::ceil(capped * 1000)));
    Woken woken;
    woken.byConfiguration = drain(configurationEvents_);
    woken.byStore = watchesStore && drain(storeEvents_);
    woken.byEnd = isEnded();
    return woken;
}

} // namespace halyard::exporting
