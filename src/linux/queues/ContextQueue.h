// The thread that runs an io_context, as a queue. Any thread may submit; what has not run
// when the context ends is dropped with it.
#pragma once

#include <asio/io_context.hpp>
#include <asio/post.hpp>
#include <asio/steady_timer.hpp>
#include <chrono>
#include <memory>
#include <utility>

#include "platform/WorkQueue.h"

namespace halyard::linux_ {

class ContextQueue final : public platform::WorkQueue {
public:
    // Borrows `context`.
    explicit ContextQueue(asio::io_context& context) : context_(context) {}

    void async(platform::Task task) override { asio::post(context_, std::move(task)); }
    void asyncAfter(std::chrono::nanoseconds delay, platform::Task task) override {
        asio::post(context_, [this, delay, task = std::move(task)] {
            auto timer = std::make_shared<asio::steady_timer>(
                context_, std::chrono::duration_cast<asio::steady_timer::duration>(delay));
            timer->async_wait([timer, task](const asio::error_code& error) {
                if (!error) {
                    task();
                }
            });
        });
    }

private:
    asio::io_context& context_;
};

} // namespace halyard::linux_
