// IpcSocketListener: the listener over a Unix stream socket.
//
// Accepting runs on the threads of the IPC layer: each connection's peer is looked at there and then delivered on the
// event queue. Only the thread that has been given the socket's event accepts. The listener keeps itself alive from
// resume() to cancel().
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcEventPool.h"
#include "platform/ipc/IpcListener.h"
#include "platform/queue/Mutex.h"

namespace platform {

/// A socket that listens for a service, and what goes with it.
struct IpcServiceSocket {
  UniqueFd socket;
  UniqueFd lock;       ///< flock: this process serves the name
  UniqueFd directory;  ///< where it was made; none for a socket that was handed over
  dev_t device = 0;    ///< of the socket file
  ino_t inode = 0;
};

class IpcSocketListener final : public IpcListener,
                                public IpcEventSource,
                                public std::enable_shared_from_this<IpcSocketListener> {
 public:
  IpcSocketListener(std::string service, IpcServiceSocket socket, QueueReference eventQueue);
  ~IpcSocketListener() override;

  void setEventHandler(IpcConnection::Handler handler) override;
  void resume() override;
  void cancel() override;

  void handleEvent() override;

 private:
  enum class State { Made, Listening, Cancelled };

  bool acceptOne();
  void deliver(IpcEvent event, bool last = false);
  void closeSocket() XT_REQUIRES(mutex_);
  void listenAgain();

  // Constant after construction.
  const std::string service_;
  const QueueReference eventQueue_;

  // Set before resume(), then on the event queue, which releases it with the last event.
  const std::shared_ptr<IpcConnection::Handler> handler_;

  Mutex mutex_;
  IpcServiceSocket socket_ XT_GUARDED_BY(mutex_);
  State state_ XT_GUARDED_BY(mutex_) = State::Made;
  std::uint64_t token_ XT_GUARDED_BY(mutex_) = 0;
  std::shared_ptr<IpcSocketListener> self_ XT_GUARDED_BY(mutex_);
  bool shortageLogged_ XT_GUARDED_BY(mutex_) = false;
};

}  // namespace platform
