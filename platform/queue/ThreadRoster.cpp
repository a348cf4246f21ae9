#include "platform/queue/ThreadRoster.h"

#include <pthread.h>
#include <signal.h>

#include <system_error>

namespace platform {

bool ThreadRoster::start(std::function<void()> body) {
  reap();
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &before);
  bool started = true;
  {
    MutexLock lock(mutex_);
    const auto self = running_.emplace(running_.end());
    try {
      *self = std::thread([this, self, body = std::move(body)] {
        pthread_setname_np(pthread_self(), name_.c_str());
        body();
        reap();
        retire(self);
      });
    } catch (const std::system_error&) {
      running_.erase(self);
      started = false;
    }
  }
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
  return started;
}

void ThreadRoster::retire(std::list<std::thread>::iterator self) {
  MutexLock lock(mutex_);
  retired_.splice(retired_.end(), running_, self);
}

void ThreadRoster::reap() {
  std::list<std::thread> ended;
  {
    MutexLock lock(mutex_);
    ended.swap(retired_);
  }
  for (std::thread& thread : ended) thread.join();
}

}  // namespace platform
