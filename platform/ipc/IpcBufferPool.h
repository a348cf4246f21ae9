// IpcBufferPool: large buffers that are kept and reused, because the first touch of fresh memory costs more than what
// is written there; they are given back to the system when none has been used for a while. For any thread.
#pragma once

#include <cstddef>
#include <vector>

#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace platform {

class IpcBufferPool {
 public:
  /// What is read into: buffers come with the size that they were given back with.
  static IpcBufferPool& forReading();
  /// What is encoded into: likewise.
  static IpcBufferPool& forWriting();

  /// The buffer that was given back last, or an empty one.
  [[nodiscard]] Bytes take();
  void give(Bytes buffer);

 private:
  void trim();
  void watch();

  Mutex mutex_;
  std::vector<Bytes> free_ XT_GUARDED_BY(mutex_);
  std::size_t kept_ XT_GUARDED_BY(mutex_) = 0;  // bytes
  bool used_ XT_GUARDED_BY(mutex_) = false;     // since the last trim
  bool watched_ XT_GUARDED_BY(mutex_) = false;
};

/// A buffer of a pool for the time of a scope.
class IpcBufferLease {
 public:
  explicit IpcBufferLease(IpcBufferPool& pool) : pool_(pool), buffer(pool.take()) {}
  ~IpcBufferLease() { pool_.give(std::move(buffer)); }
  IpcBufferLease(const IpcBufferLease&) = delete;
  IpcBufferLease& operator=(const IpcBufferLease&) = delete;

 private:
  IpcBufferPool& pool_;

 public:
  Bytes buffer;
};

}  // namespace platform
