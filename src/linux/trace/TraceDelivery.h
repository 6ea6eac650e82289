// Brings the events of a trace session to its handlers, on its queue, for as long
// as the session lives.
//
// Any thread. Shared by the session and by what it has submitted to the queue.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

#include "common/Mutex.h"
#include "platform/EventTrace.h"

namespace halyard::linux_ {

class TraceDelivery : public std::enable_shared_from_this<TraceDelivery> {
public:
    using EventHandler = platform::EventTraceSession::EventHandler;

    void setCompletion(std::function<void()> completion) HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        completion_ = std::move(completion);
    }
    void setHandler(EventHandler handler) HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        handler_ = std::move(handler);
    }
    // Before anything is delivered.
    void setQueue(std::shared_ptr<platform::SerialQueue> queue) { queue_ = std::move(queue); }

    void deliver(std::vector<trace_point> points) {
        queue_->async([self = shared_from_this(), points = std::move(points)] {
            const MutexLock lock(self->mutex_);
            for (const trace_point& point : points) {
                if (self->handler_) {
                    self->handler_(point);
                }
            }
        });
    }
    // Not under the lock: the handler may destroy the session.
    void complete() {
        queue_->async([self = shared_from_this()] {
            std::function<void()> completion;
            {
                const MutexLock lock(self->mutex_);
                completion = std::exchange(self->completion_, nullptr);
            }
            if (completion) {
                completion();
            }
        });
    }
    // Nothing is called any more once this has returned.
    void close() HY_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        handler_ = nullptr;
        completion_ = nullptr;
    }

private:
    std::shared_ptr<platform::SerialQueue> queue_;
    Mutex mutex_;
    EventHandler handler_ HY_GUARDED_BY(mutex_);
    std::function<void()> completion_ HY_GUARDED_BY(mutex_);
};

} // namespace halyard::linux_
