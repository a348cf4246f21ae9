#include "platform/queue/ThreadRoster.h"

#include <pthread.h>
#include <signal.h>

#include <cstdlib>
#include <system_error>
#include <vector>

namespace platform {
namespace {

struct Rosters {
  Mutex mutex;
  std::vector<ThreadRoster*> all XT_GUARDED_BY(mutex);
};

Rosters& rosters() {
  static auto* const instance = new Rosters;
  return *instance;
}

}  // namespace

void ThreadRoster::reapAll() {
  MutexLock lock(rosters().mutex);
  for (ThreadRoster* roster : rosters().all) roster->reap();
}

ThreadRoster::ThreadRoster(std::string name) : name_(std::move(name)) {
  MutexLock lock(rosters().mutex);
  if (rosters().all.empty()) (void)std::atexit(&reapAll);
  rosters().all.push_back(this);
}

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
