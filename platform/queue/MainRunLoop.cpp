#include "platform/queue/MainRunLoop.h"

#include <signal.h>
#include <sys/eventfd.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <deque>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/log/Log.h"
#include "platform/queue/Mutex.h"
#include "platform/queue/ThreadRoster.h"
#include "platform/queue/WorkGuard.h"

namespace platform {
namespace {

// Signals come before whatever a burst of files brings.
constexpr std::int64_t kSignalPriority = SD_EVENT_PRIORITY_IMPORTANT;
constexpr std::uint64_t kMicrosecondsPerMillisecond = 1000;
constexpr std::uint64_t kTimerAccuracy = 1000;  // microseconds; the loop's own choice is a quarter of a second

void check(int result, const char* what) {
  if (result < 0) throw InternalInconsistency(std::string(what) + ": " + std::strerror(-result));
}

// One live event source; the callback data of its C handler.
struct EventSource : MainRunLoop::Source {
  ~EventSource() override { sd_event_source_disable_unref(source); }

  sd_event_source* source = nullptr;
  std::function<void()> handler;
  std::function<void(std::uint32_t)> fdHandler;
  std::uint64_t interval = 0;
};

int onSignal(sd_event_source*, const struct signalfd_siginfo*, void* data) {
  const auto handler = static_cast<EventSource*>(data)->handler;  // a copy: the handler may destroy its source
  runGuarded(handler);
  return 0;
}

int onFd(sd_event_source*, int, std::uint32_t events, void* data) {
  const auto handler = static_cast<EventSource*>(data)->fdHandler;
  runGuarded([&] { handler(events); });
  return 0;
}

int onTimer(sd_event_source* source, std::uint64_t, void* data) {
  const auto* self = static_cast<EventSource*>(data);
  (void)sd_event_source_set_time_relative(source, self->interval);
  (void)sd_event_source_set_enabled(source, SD_EVENT_ONESHOT);
  const auto handler = self->handler;
  runGuarded(handler);
  return 0;
}

}  // namespace

struct MainRunLoop::State {
  void wake() const {
    const std::uint64_t one = 1;
    (void)!::write(wakeFd.get(), &one, sizeof one);
  }

  // Takes one item a turn of the loop, so that signals and files are looked at in between.
  static int onWake(sd_event_source*, int fd, std::uint32_t, void* data) {
    auto* self = static_cast<State*>(data);
    std::uint64_t count = 0;
    (void)!::read(fd, &count, sizeof count);
    std::function<void()> work;
    bool more = false;
    {
      MutexLock lock(self->mutex);
      if (!self->work.empty()) {
        work = std::move(self->work.front());
        self->work.pop_front();
      }
      more = !self->work.empty();
    }
    if (more) self->wake();
    if (work) runGuarded(work);
    return 0;
  }

  sd_event* loop = nullptr;
  bool stopping = false;  // on the main thread
  UniqueFd wakeFd;
  Mutex mutex;
  std::deque<std::function<void()>> work XT_GUARDED_BY(mutex);
};

MainRunLoop::MainRunLoop() : state_(std::make_unique<State>()) {
  check(sd_event_new(&state_->loop), "sd_event_new");
  state_->wakeFd = UniqueFd(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  check(sd_event_add_io(state_->loop, nullptr, state_->wakeFd.get(), EPOLLIN, &State::onWake, state_.get()),
        "sd_event_add_io");
}

MainRunLoop& MainRunLoop::main() {  // NOLINT(bugprone-exception-escape): no program entry
  static auto* const loop = new MainRunLoop;
  return *loop;
}

void MainRunLoop::blockSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGCHLD}) sigaddset(&signals, signal);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  struct sigaction ignore = {};
  ignore.sa_handler = SIG_IGN;
  sigaction(SIGPIPE, &ignore, nullptr);
  sigaction(SIGXFSZ, &ignore, nullptr);  // a file that may not grow is an error of its write
}

std::unique_ptr<MainRunLoop::Source> MainRunLoop::addSignal(int signal, std::function<void()> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = std::move(handler);
  check(sd_event_add_signal(state_->loop, &source->source, signal, &onSignal, source.get()), "sd_event_add_signal");
  check(sd_event_source_set_priority(source->source, kSignalPriority), "sd_event_source_set_priority");
  return source;
}

std::unique_ptr<MainRunLoop::Source> MainRunLoop::addFd(int fd, std::uint32_t events,
                                                        std::function<void(std::uint32_t)> handler) {
  auto source = std::make_unique<EventSource>();
  source->fdHandler = std::move(handler);
  check(sd_event_add_io(state_->loop, &source->source, fd, events, &onFd, source.get()), "sd_event_add_io");
  return source;
}

std::unique_ptr<MainRunLoop::Source> MainRunLoop::addTimer(std::uint64_t intervalMs, std::function<void()> handler) {
  auto source = std::make_unique<EventSource>();
  source->handler = std::move(handler);
  source->interval = intervalMs * kMicrosecondsPerMillisecond;
  check(sd_event_add_time_relative(state_->loop, &source->source, CLOCK_MONOTONIC, source->interval, kTimerAccuracy,
                                   &onTimer, source.get()),
        "sd_event_add_time_relative");
  return source;
}

void MainRunLoop::async(std::function<void()> work) {
  {
    MutexLock lock(state_->mutex);
    state_->work.push_back(std::move(work));
  }
  state_->wake();
}

void MainRunLoop::run() {
  state_->stopping = false;
  while (!state_->stopping) check(sd_event_run(state_->loop, UINT64_MAX), "sd_event_run");
}

void MainRunLoop::stop() {
  async([this] { state_->stopping = true; });
}

void MainRunLoop::exitProcess(int status) {
  Log::flush();
  (void)std::fflush(nullptr);
  ThreadRoster::reapAll();
  ::_exit(status);
}

}  // namespace platform
