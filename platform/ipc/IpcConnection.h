// IpcConnection: one connected Unix stream socket that carries frames both ways.
//
// Events of one connection come in order, one at a time, on a thread of the IPC layer (or, for a client made with a
// target queue, on that queue). A handler may block without holding other connections up. The connection owns its
// context object and its handler until it has been invalidated and its last event delivered. Sending never blocks: what
// the socket does not take at once goes to a bounded backlog; a backlog above its bound invalidates the connection.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/ipc/IpcMessage.h"
#include "platform/ipc/PeerIdentity.h"
#include "platform/queue/SerialQueue.h"

namespace platform {

class IpcConnection : public std::enable_shared_from_this<IpcConnection> {
 public:
  using Handler = std::function<void(const IpcEvent&)>;
  using ReplyFunction = std::function<void(const IpcReplyObject&)>;

  virtual ~IpcConnection() = default;

  /// The process at the other end, as it was when the connection was made. Never null.
  virtual const std::shared_ptr<const PeerIdentity>& peer() const = 0;
  /// The peer's process id; 0 once the connection's last event (ConnectionInvalid) has been delivered.
  virtual pid_t peerPid() const = 0;

  /// Set before resume(). The handler is released after it has been given ConnectionInvalid.
  virtual void setEventHandler(Handler handler) = 0;
  /// An object that the connection keeps alive until it is finalized.
  virtual void setContext(std::shared_ptr<void> context) = 0;
  /// Starts delivering events. Called once.
  virtual void resume() = 0;
  /// Makes the connection invalid; its handler is told so (ConnectionInvalid) as the last event. Callable at any time,
  /// before resume() too (then no event is delivered).
  virtual void cancel() = 0;
  virtual bool isValid() const = 0;

  /// Sends a reply without waiting; dropped when the request wanted none or the connection has gone. A body that the
  /// other side could not take is answered with code 4 "reply too large".
  virtual void send(const IpcReply& reply) = 0;

  // Requests are for clients: a connection that a listener has accepted cannot send any (a broken contract), nor can
  // one that has not been resumed. A request that the other side could not take (16 MiB) comes back with an error at
  // once.

  /// Sends a request and calls `reply` once on `queue` with what comes back or with the error that ended the
  /// connection. An outstanding reply keeps the connection alive.
  virtual void sendWithReply(const Value& body, const SerialQueue& queue, ReplyFunction reply) = 0;
  /// Sends a request and waits for what comes back. Callable from any thread but the connection's own event handler;
  /// the calling thread reads the reply itself.
  virtual IpcReplyObject sendWithReplySync(const Value& body) = 0;
  /// Sends a request whose reply nobody wants (frame type 3); one that is too large is logged and dropped.
  virtual void sendWithoutReply(const Value& body) = 0;
  /// Tells the peer that this process is about to end (frame type 4).
  virtual void announceTermination() = 0;

  /// "service (pid N)" or "service (invalid)".
  virtual std::string describe() const = 0;
};

/// A connection to the named service of `runtimeDirectory` whose events are delivered on `targetQueue`. Never null:
/// when nobody serves, the connection is invalid from the start, and its only event and every request come back with an
/// error that names the socket that was tried. Set its handler, then resume() it. It ends with its owner's last
/// reference.
std::shared_ptr<IpcConnection> ipcConnectService(const std::string& runtimeDirectory, const std::string& service,
                                                 const SerialQueue& targetQueue);

/// A connection over a connected socket that is handed over (tests, launched plug-ins), for requests and replies both
/// ways.
class UniqueFd;
std::shared_ptr<IpcConnection> ipcConnectionOverSocket(UniqueFd socket, const SerialQueue& targetQueue);

}  // namespace platform
