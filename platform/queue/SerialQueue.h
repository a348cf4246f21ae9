// SerialQueue: runs work one item at a time in the order of submission; a compile-time capability.
//
// Members that belong to a queue are guarded by it (XT_GUARDED_BY(queue_)); work that runs on it begins with
// assertOnQueue(). A queue without work costs no thread: asynchronous work is drained by a thread that the queue has
// while there is work (threads are kept and reused). `sync` waits its turn and then runs the work on the calling
// thread. A queue may be destroyed while work is pending: the work still runs.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>

#include "platform/queue/ThreadAnnotations.h"

namespace platform {

class XT_CAPABILITY("queue") SerialQueue {
 public:
  using Work = std::function<void()>;
  struct State;

  explicit SerialQueue(std::string label);
  ~SerialQueue();
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  const std::string& label() const noexcept;

  /// Submits `work` and returns at once. Work submitted while an IPC event handler runs may be drained by that
  /// handler's own thread after the handler has returned, if the queue is idle; order and meaning stay the same. An
  /// exception that escapes from `work` is a broken contract: it is logged at fault and the process aborts.
  void async(Work work) const;

  /// Waits for all earlier work, runs `work` on the calling thread, and returns what it returns. From work that already
  /// runs on this queue it is a broken contract (InternalInconsistency "sync on the current queue <label>"), not a
  /// hang. An exception of `work` reaches the caller; the queue goes on.
  template <typename F>
  std::invoke_result_t<F> sync(F&& work) const XT_EXCLUDES(this) {
    Turn turn(*state_);
    return std::forward<F>(work)();
  }

  /// A broken contract unless the calling thread is running this queue's work.
  void assertOnQueue() const XT_ASSERT_CAPABILITY(this);
  bool isCurrent() const noexcept;

 private:
  friend class QueueReference;

  // One a level of queued work that a thread is running; pushed on construction, popped on destruction.
  struct Frame {
    explicit Frame(const State* running) noexcept;
    ~Frame();
    Frame(const Frame&) = delete;
    Frame& operator=(const Frame&) = delete;
    static inline constinit thread_local const Frame* innermost = nullptr;
    const State* const queue;
    const Frame* const outer;
  };

  // Holds the queue for one synchronous item: enters on construction, leaves on destruction.
  class Turn {
   public:
    explicit Turn(State& queue) : hold_(queue), frame_(&queue) {}
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

   private:
    struct Hold {
      explicit Hold(State& held);
      ~Hold();
      Hold(const Hold&) = delete;
      Hold& operator=(const Hold&) = delete;
      State& queue;
    };
    const Hold hold_;  // given up last, when this thread no longer counts as running the queue's work
    const Frame frame_;
  };

  std::shared_ptr<State> state_;
};

/// A handle by which work still reaches a queue after the SerialQueue itself has been destroyed.
class QueueReference {
 public:
  QueueReference() = default;
  explicit QueueReference(const SerialQueue& queue) : state_(queue.state_) {}
  explicit operator bool() const noexcept { return state_ != nullptr; }
  void async(SerialQueue::Work work) const;

 private:
  std::shared_ptr<SerialQueue::State> state_;
};

}  // namespace platform
