// SerialQueue::State: the line of a serial queue, shared by its handles and by whoever drains it.
//
// 1. `items` is the line: asynchronous work and waiting synchronous callers, in the order of submission.
// 2. `busy` means that one thread runs the queue's work, or has been asked to. It alone takes items from the line, and
//    whoever stops being that thread hands the line on (next()): to the caller at its head, to a thread of the pool, or
//    to nobody when the line is empty.
// 3. `promisedTo` means not busy, but items wait for the end of an event handler (DeferredWork). Whoever else comes to
//    the queue takes the promise back first.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <memory>
#include <string>

#include "platform/queue/Mutex.h"
#include "platform/queue/SerialQueue.h"

namespace platform {

class DeferredWork;

struct SerialQueue::State : std::enable_shared_from_this<SerialQueue::State> {
  explicit State(std::string name) : label(std::move(name)) {}

  void async(Work work);
  /// For one synchronous item: returns when the calling thread has the queue.
  void enter();
  /// Gives the queue up after enter().
  void leave();
  /// Gives the queue a thread of the pool if it still waits for `holder`.
  void takeBackPromise(const DeferredWork* holder);
  /// Drains on the calling thread what was promised by `holder`, and at most `extra` items that came later.
  void keepPromise(const DeferredWork* holder, std::size_t extra);
  /// The calling thread is running this queue's work, maybe below other queues' work.
  bool isCurrent() const noexcept;

  const std::string label;

 private:
  struct Waiter {
    std::condition_variable granted;
    bool hasTurn = false;
  };
  struct Item {
    Work work;
    Waiter* waiter = nullptr;
  };

  void startDraining() XT_REQUIRES(mutex);
  void next() XT_REQUIRES(mutex);
  void drain(std::size_t limit);

  Mutex mutex;
  std::deque<Item> items XT_GUARDED_BY(mutex);
  bool busy XT_GUARDED_BY(mutex) = false;
  const DeferredWork* promisedTo XT_GUARDED_BY(mutex) = nullptr;
};

}  // namespace platform
