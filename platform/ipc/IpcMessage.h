// What travels on a connection, as its event handler and its callers see it.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

class IpcConnection;

/// Who counts the requests of a connection that have not been served yet.
class IpcRequestCounter {
 public:
  virtual ~IpcRequestCounter() = default;
  /// One request fewer; from any thread.
  virtual void requestServed() = 0;
};

/// Counts one request as unserved until its reply has been sent, or until the last copy of its message and reply is
/// gone. Copies of a message and its reply share one ticket; for any thread.
class IpcTicket {
 public:
  explicit IpcTicket(std::weak_ptr<IpcRequestCounter> counter) : counter_(std::move(counter)) {}
  ~IpcTicket() { serve(); }
  IpcTicket(const IpcTicket&) = delete;
  IpcTicket& operator=(const IpcTicket&) = delete;
  /// The request counts as served from here on; only the first call has an effect.
  void serve() noexcept;

 private:
  std::weak_ptr<IpcRequestCounter> counter_;
  std::atomic<bool> served_ = false;
};

/// One request as received. `body` is a dictionary for a request; another kind is delivered as "anything else".
struct IpcMessage {
  std::uint64_t id = 0;
  bool expectsReply = false;
  Value body;
  std::shared_ptr<IpcTicket> ticket = nullptr;  ///< none for a message that was not received
};

/// A reply in the making, bound to its request: fill `body`, then IpcConnection::send it once.
struct IpcReply {
  std::uint64_t id = 0;
  bool wanted = false;  ///< the request asked for a reply; a reply that nobody asked for is dropped by send
  Dictionary body;
  std::shared_ptr<IpcTicket> ticket = nullptr;  ///< the request's
};

/// What may be wrong with a connection.
struct IpcError {
  enum class Kind {
    ConnectionInvalid,    ///< the peer has gone, the connection was cancelled, or its input was broken
    TerminationImminent,  ///< the peer announced that it is about to end
    BrokenInput,          ///< a frame or body was malformed; ConnectionInvalid follows
    Other,
  };
  Kind kind = Kind::Other;
  std::string text;  ///< reason, one line
  std::string describe() const { return text; }
  friend bool operator==(const IpcError&, const IpcError&) = default;
};

/// What a listener delivers is a connection or an error; what a connection delivers is a message or an error.
using IpcEvent = std::variant<IpcMessage, IpcError, std::shared_ptr<IpcConnection>>;

/// The event as text, for log lines.
std::string describe(const IpcEvent& event);

/// What a request comes back with: a reply dictionary, or an error when the connection failed.
struct IpcReplyObject {
  Value body;  ///< nothing when `error` is set
  std::optional<IpcError> error;
  std::string describe() const { return error ? error->describe() : body.describe(); }
};

/// The reply dictionary bound to `request`.
inline IpcReply ipcCreateReply(const IpcMessage& request) {
  return {request.id, request.expectsReply, {}, request.ticket};
}

}  // namespace platform
