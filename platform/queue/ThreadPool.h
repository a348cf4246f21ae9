// ThreadPool: threads that run submitted work, started when there is more work than idle threads, kept and reused.
//
// Any thread of the pool runs any work, in no particular order between threads. Without work the threads sleep; those
// above a small number end after a while. Pools live as long as the process.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <string>

#include "platform/queue/Mutex.h"
#include "platform/queue/ThreadRoster.h"

namespace platform {

class ThreadPool {
 public:
  /// At most `maxThreads` threads. Work that waits for other work needs a pool without a bound (kUnbounded).
  ThreadPool(std::string name, std::size_t maxThreads);
  static constexpr std::size_t kUnbounded = static_cast<std::size_t>(-1);

  /// The pool that drains serial queues and runs what an IPC connection has to catch up with. Unbounded.
  static ThreadPool& workers();

  void submit(std::function<void()> work);

 private:
  void serve();

  const std::size_t maxThreads_;
  ThreadRoster roster_;
  Mutex mutex_;
  std::condition_variable wake_;
  std::deque<std::function<void()>> work_ XT_GUARDED_BY(mutex_);
  std::size_t threads_ XT_GUARDED_BY(mutex_) = 0;
  std::size_t idle_ XT_GUARDED_BY(mutex_) = 0;
};

}  // namespace platform
