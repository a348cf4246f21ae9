#include "platform/ipc/IpcEventPool.h"

#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <cerrno>
#include <vector>

#include "platform/queue/DeferredWork.h"
#include "platform/queue/WorkGuard.h"

namespace platform {
namespace {

constexpr int kMaxThreads = 64;
constexpr int kKeptThreads = 3;
constexpr int kSpareIdleMs = 10000;
constexpr std::chrono::milliseconds kDeferredWatch{5};
constexpr std::uint64_t kTimerToken = 0;

void control(int epoll, int operation, int fd, std::uint64_t token, std::uint32_t events) {
  struct epoll_event event = {};
  event.events = events | EPOLLONESHOT;
  event.data.u64 = token;
  if (::epoll_ctl(epoll, operation, fd, &event) != 0) abortWithFault("epoll_ctl failed for a descriptor in use");
}

void armDeferredWatch() {
  IpcEventPool::shared().callAfter(kDeferredWatch, [] {
    if (DeferredWork::flushOverdue()) armDeferredWatch();
  });
}

}  // namespace

IpcEventPool& IpcEventPool::shared() {
  static auto* const pool = new IpcEventPool;
  return *pool;
}

IpcEventPool::IpcEventPool()
    : epoll_(::epoll_create1(EPOLL_CLOEXEC)), timer_(::timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)) {
  if (!epoll_ || !timer_) abortWithFault("no descriptors for the event loop of the IPC layer");
  control(epoll_.get(), EPOLL_CTL_ADD, timer_.get(), kTimerToken, EPOLLIN);
  startThread();
  DeferredWork::setWatch(&armDeferredWatch);
}

std::uint64_t IpcEventPool::add(int fd, std::weak_ptr<IpcEventSource> source) {
  MutexLock lock(mutex_);
  const std::uint64_t token = ++lastToken_;
  struct epoll_event event = {};
  event.events = EPOLLONESHOT;
  event.data.u64 = token;
  if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, fd, &event) != 0) return 0;
  sources_.emplace(token, std::move(source));
  return token;
}

void IpcEventPool::arm(int fd, std::uint64_t token) {
  control(epoll_.get(), EPOLL_CTL_MOD, fd, token, EPOLLIN);
}

void IpcEventPool::disarm(int fd, std::uint64_t token) {
  control(epoll_.get(), EPOLL_CTL_MOD, fd, token, 0);
}

void IpcEventPool::remove(int fd, std::uint64_t token) {
  (void)::epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, fd, nullptr);
  MutexLock lock(mutex_);
  sources_.erase(token);
}

void IpcEventPool::startThread() {
  bool spare = false;
  {
    MutexLock lock(mutex_);
    if (threads_ >= kMaxThreads) return;
    spare = ++threads_ > kKeptThreads;
  }
  waiting_.fetch_add(1);
  if (roster_.start([this, spare] { serve(spare); })) return;
  waiting_.fetch_sub(1);
  MutexLock lock(mutex_);
  if (--threads_ == 0) abortWithFault("no thread can be started");
}

void IpcEventPool::serve(bool spare) {
  DeferredWork deferred;
  for (;;) {
    struct epoll_event event = {};
    const int count = ::epoll_wait(epoll_.get(), &event, 1, spare ? kSpareIdleMs : -1);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) abortWithFault("epoll_wait failed");
    const bool lastToWait = waiting_.fetch_sub(1) == 1;
    if (count == 0 && !lastToWait) {
      MutexLock lock(mutex_);
      --threads_;
      return;
    }
    if (lastToWait) startThread();
    if (count == 0) {
      waiting_.fetch_add(1);
      continue;
    }
    deferred.open();
    runGuarded([&] { handle(event.data.u64); });
    deferred.closeAndDrain();
    waiting_.fetch_add(1);
  }
}

void IpcEventPool::handle(std::uint64_t token) {
  if (token == kTimerToken) {
    fireTimers();
    return;
  }
  std::shared_ptr<IpcEventSource> source;
  {
    MutexLock lock(mutex_);
    const auto found = sources_.find(token);
    if (found != sources_.end()) source = found->second.lock();
  }
  if (source) source->handleEvent();
}

void IpcEventPool::callAfter(std::chrono::milliseconds delay, std::function<void()> function) {
  const Clock::time_point due = Clock::now() + delay;
  MutexLock lock(mutex_);
  const auto timer = timers_.emplace(due, std::move(function));
  if (timer == timers_.begin()) setTimer(due);
}

void IpcEventPool::setTimer(Clock::time_point due) {
  const auto sinceEpoch = std::chrono::duration_cast<std::chrono::nanoseconds>(due.time_since_epoch()).count();
  struct itimerspec time = {};
  time.it_value.tv_sec = sinceEpoch / 1'000'000'000;
  time.it_value.tv_nsec = sinceEpoch % 1'000'000'000;
  ::timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME, &time, nullptr);
}

void IpcEventPool::fireTimers() {
  std::vector<std::function<void()>> due;
  {
    MutexLock lock(mutex_);
    std::uint64_t expirations = 0;
    (void)!::read(timer_.get(), &expirations, sizeof expirations);
    const auto end = timers_.upper_bound(Clock::now());
    for (auto timer = timers_.begin(); timer != end; ++timer) due.push_back(std::move(timer->second));
    timers_.erase(timers_.begin(), end);
    if (!timers_.empty()) setTimer(timers_.begin()->first);
  }
  control(epoll_.get(), EPOLL_CTL_MOD, timer_.get(), kTimerToken, EPOLLIN);
  for (const auto& function : due) function();
}

}  // namespace platform
