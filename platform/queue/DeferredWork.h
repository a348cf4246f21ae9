// DeferredWork: what an event handler has submitted to idle serial queues, to be drained by the handler's own thread.
//
// A hand-over to another thread costs more than most requests. So a thread of the IPC layer opens a scope around an
// event handler; the first asynchronous work of an idle queue then stays with the scope (the queue is not busy, it has
// been promised a thread), and the thread drains it once the handler has returned. The promise is given back, and the
// queue gets a thread of the pool, when anybody else needs the queue, when the handler's thread is about to wait, or
// when the handler takes longer than a few milliseconds (the watch). Order and meaning are those of SerialQueue::async.
//
// One object a thread, made by it and used by it; flushOverdue() is for the watch and comes from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "platform/queue/Mutex.h"
#include "platform/queue/SerialQueue.h"

namespace platform {

class DeferredWork {
 public:
  using Watch = void (*)();

  DeferredWork();
  ~DeferredWork();
  DeferredWork(const DeferredWork&) = delete;
  DeferredWork& operator=(const DeferredWork&) = delete;

  /// Around an event handler: what the calling thread submits from here on may be deferred.
  void open();
  /// After the handler: drains the first queue that was promised this thread, for its own work and at most 16 further
  /// items; other queues get a thread of the pool.
  void closeAndDrain();

  /// The open scope of the calling thread, or null.
  static DeferredWork* current() noexcept;
  /// The calling thread is about to wait: what it has deferred gets threads of the pool.
  static void flushCurrent();

  /// `arm` is called, from any thread, when work has been deferred and no watch is armed; it shall call flushOverdue()
  /// every few milliseconds for as long as that answers true.
  /// Answers the watch that there was; without one nothing is deferred.
  static Watch setWatch(Watch arm);
  /// Gives up promises that are older than one call; false when none is left.
  [[nodiscard]] static bool flushOverdue();

  /// For SerialQueue: remembers the promise to drain `queue`.
  void add(std::shared_ptr<SerialQueue::State> queue);

 private:
  std::vector<std::shared_ptr<SerialQueue::State>> take();
  void flush();

  Mutex mutex_;
  std::vector<std::shared_ptr<SerialQueue::State>> queues_ XT_GUARDED_BY(mutex_);
  bool overdue_ XT_GUARDED_BY(mutex_) = false;  // the watch has seen these queues once
};

}  // namespace platform
