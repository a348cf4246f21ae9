// Mutex and MutexLock: std::mutex with clang's capability attributes, so that guarded members are checked.
#pragma once

#include <mutex>

#include "platform/queue/ThreadAnnotations.h"

namespace platform {

class XT_CAPABILITY("mutex") Mutex {
 public:
  void lock() XT_ACQUIRE() { mutex_.lock(); }
  void unlock() XT_RELEASE() { mutex_.unlock(); }
  bool try_lock() XT_TRY_ACQUIRE(true) { return mutex_.try_lock(); }
  /// For std::condition_variable; the caller holds the mutex through a MutexLock.
  std::mutex& native() { return mutex_; }

 private:
  std::mutex mutex_;
};

class XT_SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) XT_ACQUIRE(mutex) : lock_(mutex.native()) {}
  ~MutexLock() XT_RELEASE() {}
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;
  /// For std::condition_variable::wait.
  std::unique_lock<std::mutex>& native() { return lock_; }

 private:
  std::unique_lock<std::mutex> lock_;
};

}  // namespace platform
