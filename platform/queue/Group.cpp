#include "platform/queue/Group.h"

#include "platform/queue/DeferredWork.h"
#include "platform/value/InternalInconsistency.h"

namespace platform {

void Group::enter(std::size_t count) {
  MutexLock lock(mutex_);
  count_ += count;
}

void Group::leave() {
  MutexLock lock(mutex_);
  if (count_ == 0) throw InternalInconsistency("group left more often than entered");
  if (--count_ == 0) idle_.notify_all();  // under the lock: the waiter may destroy the group
}

void Group::wait() {
  DeferredWork::flushCurrent();
  MutexLock lock(mutex_);
  while (count_ > 0) idle_.wait(lock.native());
}

}  // namespace platform
