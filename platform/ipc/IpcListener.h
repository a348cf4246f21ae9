// IpcListener: the named service of a daemon, a Unix stream socket at <runtime>/services/<name>.
//
// A service that a living process already serves cannot be created; a socket that a dead process left behind is
// replaced (who is first is decided by flock on <name>.lock); a socket handed over by activation (LISTEN_FDS) is used
// and never unlinked. The socket has mode 0666 in a directory of mode 0755: who may do what is decided by who the peer
// is, never by reaching the socket. Events (new connection, error) come on the queue given at creation once the
// listener is resumed.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/ipc/IpcConnection.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/Error.h"

namespace platform {

class IpcListener {
 public:
  virtual ~IpcListener() = default;
  /// Set before resume(). The handler is released after it has been given ConnectionInvalid.
  virtual void setEventHandler(IpcConnection::Handler handler) = 0;
  /// From here on connections are accepted.
  virtual void resume() = 0;
  /// Stops listening, removes the socket that it made, and delivers ConnectionInvalid.
  virtual void cancel() = 0;
};

/// The listener for `service`, or null with `error` (name malformed, already served, directory not usable). Connections
/// made before resume() wait until then.
std::shared_ptr<IpcListener> ipcCreateListener(const std::string& runtimeDirectory, const std::string& service,
                                               const SerialQueue& eventQueue, Error* error);

}  // namespace platform
