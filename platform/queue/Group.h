// Group: counts work that has been entered and not yet left; wait() returns once the count is zero.
#pragma once

#include <condition_variable>
#include <cstddef>

#include "platform/queue/Mutex.h"

namespace platform {

class Group {
 public:
  void enter(std::size_t count = 1);
  /// Leaving more often than entering is a broken contract.
  void leave();
  /// Waits without a time limit.
  void wait();

 private:
  Mutex mutex_;
  std::condition_variable idle_;
  std::size_t count_ XT_GUARDED_BY(mutex_) = 0;
};

}  // namespace platform
