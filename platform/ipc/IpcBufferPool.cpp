#include "platform/ipc/IpcBufferPool.h"

#include <malloc.h>

#include <utility>

#include "platform/ipc/IpcEventPool.h"

namespace platform {
namespace {

constexpr std::size_t kMaxKept = std::size_t{64} << 20;
constexpr std::chrono::seconds kIdleTime{10};

}  // namespace

IpcBufferPool& IpcBufferPool::forReading() {
  static auto* const pool = new IpcBufferPool;
  return *pool;
}

IpcBufferPool& IpcBufferPool::forWriting() {
  static auto* const pool = new IpcBufferPool;
  return *pool;
}

Bytes IpcBufferPool::take() {
  MutexLock lock(mutex_);
  used_ = true;
  if (free_.empty()) return {};
  Bytes buffer = std::move(free_.back());
  free_.pop_back();
  kept_ -= buffer.capacity();
  return buffer;
}

void IpcBufferPool::give(Bytes buffer) {
  bool startWatch = false;
  {
    MutexLock lock(mutex_);
    if (buffer.capacity() == 0 || kept_ + buffer.capacity() > kMaxKept) return;
    kept_ += buffer.capacity();
    free_.push_back(std::move(buffer));
    startWatch = !std::exchange(watched_, true);
  }
  if (startWatch) watch();
}

void IpcBufferPool::watch() {
  IpcEventPool::shared().callAfter(kIdleTime, [this] { trim(); });
}

void IpcBufferPool::trim() {
  bool watched = false;
  {
    MutexLock lock(mutex_);
    watched = watched_ = std::exchange(used_, false);
    if (!watched) {
      free_.clear();
      kept_ = 0;
    }
  }
  if (watched) {
    watch();
  } else {
    ::malloc_trim(0);  // with the small pieces around them, which the heap keeps while it is in use
  }
}

}  // namespace platform
