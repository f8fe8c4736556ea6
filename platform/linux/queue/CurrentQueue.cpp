#include "platform/linux/queue/CurrentQueue.h"

namespace docuvend::linux_platform {
namespace {

// Has no destructor, so it may be used as long as the thread runs.
thread_local const CurrentQueue* innermost = nullptr;

}  // namespace

CurrentQueue::CurrentQueue(const void* queue, Chain chain)
    : queue_(queue), outer_(chain == Chain::continued ? innermost : nullptr), previous_(innermost) {
  innermost = this;
}

CurrentQueue::~CurrentQueue() { innermost = previous_; }

bool CurrentQueue::isCurrent(const void* queue) {
  for (const CurrentQueue* frame = innermost; frame != nullptr; frame = frame->outer_) {
    if (frame->queue_ == queue) return true;
  }
  return false;
}

}  // namespace docuvend::linux_platform
