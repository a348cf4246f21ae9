#include "platform/queue/ThreadPool.h"

#include <chrono>

#include "platform/log/Log.h"
#include "platform/queue/WorkGuard.h"

namespace platform {
namespace {

constexpr std::size_t kKeptIdle = 4;
constexpr std::chrono::seconds kIdleTime{10};

}  // namespace

ThreadPool::ThreadPool(std::string name, std::size_t maxThreads) : maxThreads_(maxThreads), roster_(std::move(name)) {}

ThreadPool& ThreadPool::workers() {
  static auto* pool = new ThreadPool("worker", kUnbounded);
  return *pool;
}

void ThreadPool::submit(std::function<void()> work) {
  {
    MutexLock lock(mutex_);
    work_.push_back(std::move(work));
    if (work_.size() <= idle_) {
      wake_.notify_one();
      return;
    }
    if (threads_ >= maxThreads_) return;
    ++threads_;
  }
  if (roster_.start([this] { serve(); })) return;
  // The work stays in line for the threads that there are; without any the system is beyond use.
  MutexLock lock(mutex_);
  if (--threads_ == 0) abortWithFault("no thread can be started");
}

void ThreadPool::serve() {
  MutexLock lock(mutex_);
  for (;;) {
    while (work_.empty()) {
      bool timedOut = false;
      if (++idle_ <= kKeptIdle) {
        wake_.wait(lock.native());
      } else {
        timedOut = wake_.wait_for(lock.native(), kIdleTime) == std::cv_status::timeout;
      }
      --idle_;
      if (timedOut && work_.empty()) {
        --threads_;
        return;
      }
    }
    std::function<void()> work = std::move(work_.front());
    work_.pop_front();
    lock.native().unlock();
    runGuarded(work);
    work = nullptr;
    lock.native().lock();
  }
}

}  // namespace platform
