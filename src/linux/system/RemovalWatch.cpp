#include "linux/system/RemovalWatch.h"

#include <cerrno>
#include <sys/inotify.h>
#include <system_error>
#include <unistd.h>
#include <utility>

#include "platform/Log.h"

namespace halyard::linux_ {

RemovalWatch::RemovalWatch(asio::io_context& context, const std::filesystem::path& folder,
                           std::string_view prefix, std::function<void()> removed,
                           std::chrono::milliseconds settleTime)
    : prefix_(prefix), removed_(std::move(removed)), settleTime_(settleTime), events_(context),
      settled_(context) {
    const int descriptor = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    if (descriptor >= 0) {
        events_.assign(descriptor);
    }
    if (descriptor < 0 ||
        ::inotify_add_watch(descriptor, folder.c_str(),
                            IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_ONLYDIR) < 0) {
        HY_LOG_DEFAULT(HYReportingPlatformCategory, "cannot watch {}: {}", folder.native(),
                       std::generic_category().message(errno));
        return;
    }
    awaitEvents();
}

void RemovalWatch::awaitEvents() {
    events_.async_wait(asio::posix::stream_descriptor::wait_read,
                       [this, alive = std::weak_ptr(alive_)](const asio::error_code& error) {
                           if (error || alive.expired()) {
                               return;
                           }
                           if (readEvents()) {
                               tellWhenSettled();
                           }
                           awaitEvents();
                       });
}

bool RemovalWatch::readEvents() {
    alignas(inotify_event) char buffer[4096];
    bool matters = false;
    for (;;) {
        const ssize_t got = ::read(events_.native_handle(), buffer, sizeof buffer);
        if (got <= 0) {
            return matters; // Nothing more for now.
        }
        for (std::size_t at = 0; at + sizeof(inotify_event) <= static_cast<std::size_t>(got);) {
            const auto* const event = reinterpret_cast<const inotify_event*>(buffer + at);
            const std::string_view name = event->len == 0 ? "" : event->name;
            matters = matters || (event->mask & IN_Q_OVERFLOW) != 0 || name.starts_with(prefix_);
            at += sizeof(inotify_event) + event->len;
        }
    }
}

void RemovalWatch::tellWhenSettled() {
    settled_.expires_after(settleTime_);
    settled_.async_wait([this, alive = std::weak_ptr(alive_)](const asio::error_code& error) {
        if (!error && !alive.expired()) {
            removed_();
        }
    });
}

} // namespace halyard::linux_
