#include "platform/ipc/IpcSocketListener.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <utility>

#include "platform/ipc/IpcSocketConnection.h"
#include "platform/log/Log.h"

namespace platform {
namespace {

// How long accepting pauses when the process has no descriptors or memory for another connection.
constexpr std::chrono::milliseconds kShortagePause{100};

bool isShortage(int error) {
  return error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM;
}

}  // namespace

IpcSocketListener::IpcSocketListener(std::string service, IpcServiceSocket socket, QueueReference eventQueue)
    : service_(std::move(service)),
      eventQueue_(std::move(eventQueue)),
      handler_(std::make_shared<IpcConnection::Handler>()),
      socket_(std::move(socket)) {}

IpcSocketListener::~IpcSocketListener() {
  MutexLock lock(mutex_);
  closeSocket();
}

void IpcSocketListener::setEventHandler(IpcConnection::Handler handler) {
  *handler_ = std::move(handler);
}

void IpcSocketListener::resume() {
  MutexLock lock(mutex_);
  if (state_ != State::Made) return;
  state_ = State::Listening;
  self_ = shared_from_this();
  token_ = IpcEventPool::shared().add(socket_.socket.get(), self_);
  if (token_ == 0) {
    deliver(IpcError{IpcError::Kind::Other, std::string("cannot wait for connections: ") + std::strerror(errno)});
    return;
  }
  IpcEventPool::shared().arm(socket_.socket.get(), token_);
}

void IpcSocketListener::cancel() {
  std::shared_ptr<IpcSocketListener> own;
  bool wasListening = false;
  {
    MutexLock lock(mutex_);
    if (state_ == State::Cancelled) return;
    wasListening = std::exchange(state_, State::Cancelled) == State::Listening;
    closeSocket();
    own.swap(self_);
  }
  if (wasListening) {
    deliver(IpcError{IpcError::Kind::ConnectionInvalid, "the listener was cancelled"}, true);
  } else {
    *handler_ = nullptr;
  }
}

// The socket file goes only if it is still the one that was made here.
void IpcSocketListener::closeSocket() {
  if (!socket_.socket) return;
  if (token_ != 0) IpcEventPool::shared().remove(socket_.socket.get(), token_);
  if (socket_.directory) {
    struct stat status = {};
    if (::fstatat(socket_.directory.get(), service_.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        status.st_dev == socket_.device && status.st_ino == socket_.inode) {
      (void)::unlinkat(socket_.directory.get(), service_.c_str(), 0);
    }
  }
  socket_ = {};
}

void IpcSocketListener::handleEvent() {
  while (acceptOne()) {
  }
}

// Accepts one connection; false when there is none for now.
bool IpcSocketListener::acceptOne() {
  UniqueFd socket;
  {
    MutexLock lock(mutex_);
    if (state_ != State::Listening) return false;
    socket.reset(::accept4(socket_.socket.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!socket) {
      const int error = errno;
      if (error == ECONNABORTED || error == EINTR) return true;
      if (!isShortage(error)) {
        IpcEventPool::shared().arm(socket_.socket.get(), token_);
        return false;
      }
      if (!std::exchange(shortageLogged_, true)) {
        Log::processDefault().error("cannot accept connections to {} for now: {}", service_, std::strerror(error));
      }
      IpcEventPool::shared().callAfter(kShortagePause, [weak = weak_from_this()] {
        if (const auto listener = weak.lock()) listener->listenAgain();
      });
      return false;
    }
  }
  const int on = 1;  // whether the listening socket's option is inherited depends on the time of the connection
  (void)::setsockopt(socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
  auto peer = PeerIdentity::ofSocket(socket.get());
  IpcSocketConnection::Settings settings;
  settings.name = service_;
  settings.service = true;
  deliver(std::shared_ptr<IpcConnection>(
      IpcSocketConnection::make(std::move(socket), std::move(peer), std::move(settings))));
  return true;
}

void IpcSocketListener::listenAgain() {
  MutexLock lock(mutex_);
  if (state_ == State::Listening) IpcEventPool::shared().arm(socket_.socket.get(), token_);
}

void IpcSocketListener::deliver(IpcEvent event, bool last) {
  eventQueue_.async([handler = handler_, event = std::move(event), last] {
    if (*handler) (*handler)(event);
    if (last) *handler = nullptr;
  });
}

}  // namespace platform
