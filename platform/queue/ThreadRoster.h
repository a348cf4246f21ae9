// ThreadRoster: the threads of a pool, started on demand and joined after they have retired; none is ever detached.
//
// Threads start with all signals blocked, so that a program that uses the library keeps its signals on its own threads.
// Callable from any thread. A roster lives as long as the process; at its exit the threads that have ended are joined,
// and those that still run are not.
#pragma once

#include <cstddef>
#include <functional>
#include <list>
#include <string>
#include <thread>

#include "platform/queue/Mutex.h"

namespace platform {

class ThreadRoster {
 public:
  /// `name` (at most 15 bytes) is what a debugger shows for each thread.
  explicit ThreadRoster(std::string name);

  /// Starts a thread that runs `body`; false when the system gives none. `body` may end at any time.
  [[nodiscard]] bool start(std::function<void()> body);
  /// Joins the threads whose bodies have ended.
  void reap();
  /// The same for every roster of the process.
  static void reapAll();

 private:
  void retire(std::list<std::thread>::iterator self);

  const std::string name_;
  Mutex mutex_;
  std::list<std::thread> running_ XT_GUARDED_BY(mutex_);
  std::list<std::thread> retired_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
