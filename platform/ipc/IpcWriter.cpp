#include "platform/ipc/IpcWriter.h"

#include <sys/epoll.h>

#include <array>
#include <cerrno>

#include "platform/ipc/IpcOutput.h"
#include "platform/queue/WorkGuard.h"

namespace platform {

IpcWriter& IpcWriter::shared() {
  static auto* const writer = new IpcWriter;
  return *writer;
}

IpcWriter::IpcWriter() : epoll_(::epoll_create1(EPOLL_CLOEXEC)) {
  if (!epoll_ || !roster_.start([this] { serve(); })) abortWithFault("the writer thread cannot be started");
}

std::uint64_t IpcWriter::watch(int socket, std::weak_ptr<IpcOutput> output) {
  MutexLock lock(mutex_);
  const std::uint64_t token = ++lastToken_;
  struct epoll_event event = {};
  // Edge-triggered: a socket that has room reports each further taking by the peer.
  event.events = EPOLLOUT | EPOLLET;
  event.data.u64 = token;
  if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, socket, &event) != 0) return 0;
  outputs_.emplace(token, std::move(output));
  return token;
}

void IpcWriter::unwatch(int socket, std::uint64_t token) {
  (void)::epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, socket, nullptr);
  MutexLock lock(mutex_);
  outputs_.erase(token);
}

void IpcWriter::serve() {
  std::array<struct epoll_event, 16> events;
  for (;;) {
    const int count = ::epoll_wait(epoll_.get(), events.data(), static_cast<int>(events.size()), -1);
    if (count < 0 && errno != EINTR) abortWithFault("epoll_wait failed");
    for (int i = 0; i < count; ++i) {
      std::shared_ptr<IpcOutput> output;
      {
        MutexLock lock(mutex_);
        const auto found = outputs_.find(events[static_cast<std::size_t>(i)].data.u64);
        if (found != outputs_.end()) output = found->second.lock();
      }
      if (output) runGuarded([&] { output->flush(); });
    }
  }
}

}  // namespace platform
