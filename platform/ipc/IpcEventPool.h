// IpcEventPool: the threads that wait for events of all connections and listeners, and run their handlers.
//
// A few threads wait on one epoll set in which every source is armed for one event at a time. The thread that is woken
// handles the event itself; when every thread is busy another one is started, up to a bound, so that a handler may
// block. What a handler submits to an idle serial queue is drained by the same thread afterwards (DeferredWork).
// Callable from any thread; lives as long as the process; its threads start with the first source.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <unordered_map>

#include "platform/files/UniqueFd.h"
#include "platform/queue/Mutex.h"
#include "platform/queue/ThreadRoster.h"

namespace platform {

/// Something with a descriptor that becomes readable.
class IpcEventSource {
 public:
  virtual ~IpcEventSource() = default;
  /// The descriptor was readable, or had an error, after it had been armed; on a thread of the pool. An event that was
  /// on its way when the source was disarmed may still come.
  virtual void handleEvent() = 0;
};

class IpcEventPool {
 public:
  static IpcEventPool& shared();

  /// Adds `fd`, which is not armed yet; answers the token that names it, 0 when the system refuses (errno says why).
  /// `source` is not kept alive.
  [[nodiscard]] std::uint64_t add(int fd, std::weak_ptr<IpcEventSource> source);
  /// From here on the next event is handled, once.
  void arm(int fd, std::uint64_t token);
  /// From here on none is, but for the end of both directions, which may still come once.
  void disarm(int fd, std::uint64_t token);
  /// Before `fd` is closed.
  void remove(int fd, std::uint64_t token);

  /// Calls `function` once after `delay` on a thread of the pool; it must not block.
  void callAfter(std::chrono::milliseconds delay, std::function<void()> function);

 private:
  using Clock = std::chrono::steady_clock;

  IpcEventPool();
  void startThread();
  void serve(bool spare);
  void handle(std::uint64_t token);
  void setTimer(Clock::time_point due) XT_REQUIRES(mutex_);
  void fireTimers();

  // Constant after construction.
  UniqueFd epoll_;
  UniqueFd timer_;
  ThreadRoster roster_{"ipc-events"};

  std::atomic<int> waiting_ = 0;  // threads that wait, or are about to
  Mutex mutex_;
  int threads_ XT_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastToken_ XT_GUARDED_BY(mutex_) = 0;
  std::unordered_map<std::uint64_t, std::weak_ptr<IpcEventSource>> sources_ XT_GUARDED_BY(mutex_);
  std::multimap<Clock::time_point, std::function<void()>> timers_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
