#include "platform/queue/ConcurrentQueue.h"

#include <algorithm>
#include <thread>

#include "platform/queue/ThreadPool.h"

namespace platform {

ConcurrentQueue::ConcurrentQueue()
    : width_(std::max(1U, std::thread::hardware_concurrency())), pool_(*new ThreadPool("concurrent", width_)) {}

ConcurrentQueue& ConcurrentQueue::shared() {
  static auto* const queue = new ConcurrentQueue;
  return *queue;
}

void ConcurrentQueue::async(std::function<void()> work) {
  pool_.submit(std::move(work));
}

}  // namespace platform
