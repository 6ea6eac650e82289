#include "platform/WorkQueue.h"

#include <utility>

namespace halyard::platform {
namespace {

const SerialQueue*& running() {
    thread_local const SerialQueue* queue = nullptr;
    return queue;
}

} // namespace

const SerialQueue* SerialQueue::current() {
    return running();
}

SerialQueue::Running::Running(const SerialQueue& queue)
    : outer_(std::exchange(running(), &queue)) {}

SerialQueue::Running::~Running() {
    running() = outer_;
}

} // namespace halyard::platform
