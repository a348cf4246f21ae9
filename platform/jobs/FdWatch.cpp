#include "platform/jobs/FdWatch.h"

#include <fcntl.h>
#include <sys/epoll.h>

#include "platform/files/UniqueFd.h"
#include "platform/queue/MainRunLoop.h"

namespace platform {

// Used on the main thread alone, but for its making.
struct FdWatch::State {
  UniqueFd fd;
  std::function<void()> handler;
  bool over = false;
  std::unique_ptr<MainRunLoop::Source> source;
};

FdWatch::FdWatch(int fd, std::function<void()> handler) : state_(std::make_shared<State>()) {
  state_->fd = UniqueFd(fcntl(fd, F_DUPFD_CLOEXEC, 0));
  state_->handler = std::move(handler);
  MainRunLoop::main().async([state = state_] {
    if (state->over || !state->fd) return;
    state->source = MainRunLoop::main().addFd(state->fd.get(), EPOLLIN | EPOLLET, [weak = std::weak_ptr(state)](auto) {
      const auto live = weak.lock();
      if (live != nullptr && !live->over) live->handler();
    });
  });
}

FdWatch::~FdWatch() {
  MainRunLoop::main().async([state = std::move(state_)] {
    state->over = true;
    state->source.reset();
    state->handler = nullptr;
  });
}

}  // namespace platform
