#include "linux/config/ConfigurationWatch.h"

#include <asio/post.hpp>
#include <cerrno>
#include <cstring>
#include <sys/inotify.h>
#include <unistd.h>
#include <utility>

#include "linux/config/SettingsFiles.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

constexpr std::uint32_t kWritten = IN_CLOSE_WRITE | IN_MOVED_TO;
constexpr std::uint32_t kUnsettled = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_ATTRIB;
constexpr std::uint32_t kWatchedGone = IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT;
// Of a directory above: only what can bring the next one.
constexpr std::uint32_t kAppeared = IN_CREATE | IN_MOVED_TO;

// Directories may appear while we look for the nearest one.
constexpr int kMaxAttempts = 8;

bool isMissing(int error) {
    return error == ENOENT || error == ENOTDIR;
}

void logFailure(const std::filesystem::path& path) {
    HY_LOG_ERROR(HYReportingPlatformCategory,
                 "cannot watch {}: {}; changes of the configuration are only seen on SIGHUP",
                 path.native(), std::generic_category().message(errno));
}

} // namespace

ConfigurationWatch::ConfigurationWatch(asio::io_context& context, std::filesystem::path directory,
                                       std::string_view fileName, std::string_view dropInFolder,
                                       std::function<void()> changed,
                                       std::chrono::milliseconds settleTime)
    : context_(context), directory_(std::move(directory)), fileName_(fileName),
      dropInFolder_(dropInFolder), changed_(std::move(changed)), settleTime_(settleTime),
      events_(context), settled_(context) {
    const int descriptor = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    if (descriptor < 0) {
        logFailure(directory_);
        return;
    }
    events_.assign(descriptor);
    arm();
    awaitEvents();
}

ConfigurationWatch::~ConfigurationWatch() = default;

// Leaves one watch of the nearest directory, or none and a log line; and one of the
// drop-ins where they are.
void ConfigurationWatch::arm() {
    for (int attempt = 0; attempt < kMaxAttempts; ++attempt) {
        if (!watchNearest()) {
            return;
        }
        watchDropIns();
        std::error_code ignored;
        if (watched_ == directory_ || !std::filesystem::exists(watched_ / awaited_, ignored)) {
            return;
        }
        // Made between the two looks: no event will tell.
    }
}

bool ConfigurationWatch::watchNearest() {
    if (watch_ >= 0) {
        ::inotify_rm_watch(events_.native_handle(), watch_);
    }
    watched_ = directory_;
    awaited_ = fileName_;
    for (;;) {
        const std::uint32_t interest = watched_ == directory_ ? kWritten | kUnsettled : kAppeared;
        watch_ = ::inotify_add_watch(events_.native_handle(), watched_.c_str(),
                                     interest | kWatchedGone | IN_ONLYDIR);
        if (watch_ >= 0) {
            return true;
        }
        if (!isMissing(errno) || watched_ == watched_.parent_path()) {
            logFailure(watched_);
            return false;
        }
        awaited_ = watched_.filename();
        watched_ = watched_.parent_path();
    }
}

// Whoever calls this tells, so that events of the watch given up are not missed.
void ConfigurationWatch::watchDropIns() {
    if (dropInWatch_ >= 0) {
        ::inotify_rm_watch(events_.native_handle(), dropInWatch_);
    }
    const std::filesystem::path folder = directory_ / dropInFolder_;
    // A folder that is the directory itself, by a link, must not take over its watch.
    dropInWatch_ =
        ::inotify_add_watch(events_.native_handle(), folder.c_str(),
                            kWritten | kUnsettled | kWatchedGone | IN_ONLYDIR | IN_MASK_CREATE);
    if (dropInWatch_ < 0 && !isMissing(errno) && errno != EEXIST) {
        logFailure(folder);
    }
}

void ConfigurationWatch::awaitEvents() {
    events_.async_wait(asio::posix::stream_descriptor::wait_read,
                       [this, alive = std::weak_ptr(alive_)](const asio::error_code& error) {
                           if (!error && !alive.expired()) {
                               readEvents();
                               awaitEvents();
                           }
                       });
}

void ConfigurationWatch::readEvents() {
    alignas(inotify_event) char buffer[4096];
    for (;;) {
        const ssize_t got = ::read(events_.native_handle(), buffer, sizeof buffer);
        if (got <= 0) {
            return; // Nothing more for now.
        }
        const auto end = static_cast<std::size_t>(got);
        for (std::size_t at = 0; at + sizeof(inotify_event) <= end;) {
            const auto* const event = reinterpret_cast<const inotify_event*>(buffer + at);
            handle(*event);
            at += sizeof(inotify_event) + event->len;
        }
    }
}

void ConfigurationWatch::handle(const inotify_event& event) {
    if ((event.mask & IN_Q_OVERFLOW) != 0) {
        arm();
        tellSoon();
        return;
    }
    if (event.wd == watch_) {
        handleNearest(event);
    } else if (event.wd == dropInWatch_) {
        handleDropIn(event);
    } // Else it is of a watch that was given up.
}

void ConfigurationWatch::handleNearest(const inotify_event& event) {
    if ((event.mask & kWatchedGone) != 0) {
        arm();
        tellWhenSettled();
        return;
    }
    const std::string_view name = event.len == 0 ? "" : event.name;
    if (watched_ == directory_ && name == dropInFolder_) {
        watchDropIns();
        tell(event.mask);
    } else if (name != awaited_) {
        return;
    } else if (watched_ != directory_) {
        arm();
        tellWhenSettled();
    } else {
        tell(event.mask);
    }
}

void ConfigurationWatch::handleDropIn(const inotify_event& event) {
    if ((event.mask & kWatchedGone) != 0) {
        watchDropIns();
        tellWhenSettled();
    } else if (event.len > 0 && isDropIn(event.name)) {
        tell(event.mask);
    }
}

void ConfigurationWatch::tell(std::uint32_t what) {
    if ((what & kWritten) != 0) {
        tellSoon();
    } else {
        tellWhenSettled();
    }
}

// At the end of this turn of the loop, however many events it brings.
void ConfigurationWatch::tellSoon() {
    settled_.cancel();
    if (std::exchange(telling_, true)) {
        return;
    }
    asio::post(context_, [this, alive = std::weak_ptr(alive_)] {
        if (!alive.expired()) {
            telling_ = false;
            changed_();
        }
    });
}

void ConfigurationWatch::tellWhenSettled() {
    settled_.expires_after(settleTime_);
    settled_.async_wait([this, alive = std::weak_ptr(alive_)](const asio::error_code& error) {
        if (!error && !alive.expired()) {
            tellSoon();
        }
    });
}

} // namespace halyard::linux_
