// ConcurrentQueue: a fixed pool, one thread a core, used for nothing but leaf work that never waits.
#pragma once

#include <cstddef>
#include <functional>

namespace platform {

class ThreadPool;

class ConcurrentQueue {
 public:
  /// The process's one pool; its threads start with the first work and are never joined while work may come.
  static ConcurrentQueue& shared();
  /// Submits `work`; any thread of the pool runs it, in no particular order. An exception that escapes from it is a
  /// broken contract, as with SerialQueue.
  void async(std::function<void()> work);
  /// Number of threads of the pool.
  std::size_t width() const noexcept { return width_; }

 private:
  ConcurrentQueue();
  const std::size_t width_;
  ThreadPool& pool_;  // lives as long as the process
};

}  // namespace platform
