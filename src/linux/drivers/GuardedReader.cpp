#include "linux/drivers/GuardedReader.h"

#include <algorithm>
#include <pthread.h>

#include "linux/queues/BlockingSection.h"

namespace halyard::linux_ {
namespace {

Reading stuckReading() {
    Reading reading;
    reading.fault = "reading it does not come to an end";
    return reading;
}

} // namespace

GuardedReader::~GuardedReader() {
    if (thread_.joinable()) {
        {
            const std::lock_guard lock(desk_->mutex);
            desk_->left = true;
        }
        desk_->changed.notify_all();
        const BlockingSection blocking;
        thread_.join();
    }
}

void GuardedReader::work(const std::shared_ptr<Desk>& desk) {
    std::unique_lock lock(desk->mutex);
    for (;;) {
        desk->changed.wait(
            lock, [&] { return desk->left || desk->readings.size() < desk->sources.size(); });
        if (desk->left) {
            desk->readings.emplace_back(); // Tells that no source is in use here.
            return;
        }
        const auto source = desk->sources[desk->readings.size()];
        const auto now = desk->now;
        lock.unlock();
        Reading reading = source->read(now);
        lock.lock();
        desk->readings.push_back(std::move(reading));
        if (desk->left || desk->readings.size() == desk->sources.size()) {
            desk->changed.notify_all();
        }
    }
}

void GuardedReader::startThread() {
    desk_ = std::make_shared<Desk>();
    thread_ = std::thread([desk = desk_] {
        ::pthread_setname_np(::pthread_self(), "driver reads");
        work(desk);
    });
}

void GuardedReader::leaveThread(const std::shared_ptr<ChannelSource>& source) {
    thread_.detach();
    stuck_.push_back({std::move(desk_), source});
    desk_.reset();
}

void GuardedReader::forgetThoseThatCameBack() {
    std::erase_if(stuck_, [](const Stuck& each) {
        const std::lock_guard lock(each.desk->mutex);
        return !each.desk->readings.empty();
    });
}

bool GuardedReader::isStuck(const ChannelSource& source) const {
    return std::any_of(stuck_.begin(), stuck_.end(),
                       [&](const Stuck& each) { return each.source.get() == &source; });
}

std::vector<Reading> GuardedReader::read(std::span<const std::shared_ptr<ChannelSource>> sources,
                                         platform::SteadyTime now) {
    forgetThoseThatCameBack();
    std::vector<Reading> result(sources.size(), stuckReading());
    std::vector<std::size_t> waiting; // places of those that are to be read
    for (std::size_t place = 0; place < sources.size(); ++place) {
        if (!isStuck(*sources[place])) {
            waiting.push_back(place);
        }
    }
    while (!waiting.empty() && stuck_.size() < kMaxStuck) {
        if (desk_ == nullptr) {
            startThread();
        }
        std::unique_lock lock(desk_->mutex);
        desk_->now = now;
        desk_->readings.clear();
        desk_->sources.clear();
        for (const std::size_t place : waiting) {
            desk_->sources.push_back(sources[place]);
        }
        desk_->changed.notify_all();
        const BlockingSection blocking;
        const bool inTime = desk_->changed.wait_for(
            lock, patience_, [&] { return desk_->readings.size() == waiting.size(); });
        const std::size_t done = desk_->readings.size();
        for (std::size_t i = 0; i < done; ++i) {
            result[waiting[i]] = std::move(desk_->readings[i]);
        }
        waiting.erase(waiting.begin(), waiting.begin() + static_cast<std::ptrdiff_t>(done));
        if (!inTime) {
            // Only the reading that is under way is still awaited there.
            desk_->left = true;
            desk_->readings.clear();
            desk_->sources.resize(1);
            lock.unlock();
            leaveThread(sources[waiting.front()]);
            waiting.erase(waiting.begin());
        }
    }
    return result;
}

} // namespace halyard::linux_
