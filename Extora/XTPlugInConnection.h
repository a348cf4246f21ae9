// XTPlugInConnection: what a host and a plug-in that was launched for it say to each other: operations with arguments,
// both ways.
//
// Either side may export an interface and say which one it expects of the other. A message that does not fit is refused
// before anybody's code sees it: a call with an unknown operation or with arguments of other classes is answered with
// an error by the receiving side; a reply with arguments of other classes is an error for the caller. Without an
// interface everything passes.
//
// On the wire (docs/wire-protocol.md) a call is {"operation": name, "arguments": [...]}; the answer is
// {"arguments": [...]}, or {"error": text, "errorcode": code}.
//
// Calls that come in are served one after another on the queue that was given, which must outlive the connection. For
// any thread; it ends with its last reference.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "Extora/XTError.h"
#include "platform/files/UniqueFd.h"
#include "platform/interfaces/InterfaceDescription.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/Value.h"

namespace extora {

class XTPlugInConnection : public std::enable_shared_from_this<XTPlugInConnection> {
 public:
  using Array = platform::Array;
  using Interface = std::shared_ptr<const platform::InterfaceDescription>;
  /// What an operation comes to: the arguments of its reply, or why it failed.
  struct Answer {
    Array arguments;
    std::optional<Error> error;
  };
  using Handler = std::function<Answer(const std::string& operation, const Array& arguments)>;

  /// For a host: over the socket that XTHostServices::launch has answered.
  static std::shared_ptr<XTPlugInConnection> initWithSocket(platform::UniqueFd socket,
                                                            const platform::SerialQueue& queue);
  /// For a plug-in: to the host that it was launched for (descriptor EXTORA_IPC_FD). Null for a process that was not
  /// launched as a plug-in, and for a second call.
  static std::shared_ptr<XTPlugInConnection> initForPlugIn(const platform::SerialQueue& queue);
  ~XTPlugInConnection();

  // Before resume():

  /// Lets the other side call `handler`, within the interface unless that is null. Without this every call is refused.
  void exportInterface(Interface interface, Handler handler);
  /// What the other side exports; null for anything.
  void setRemoteInterface(Interface interface);
  /// Called once on the queue when the other side has gone.
  void setEndHandler(std::function<void()> handler);
  /// Begins to serve. Once.
  void resume();

  /// Calls the other side and waits for its answer. A call that the remote interface does not allow is not sent. From
  /// any thread but the queue's own. The code of a connection that has been lost is XTErrorRequest, that of a message
  /// that does not fit XTErrorInterface.
  [[nodiscard]] Answer call(const std::string& operation, const Array& arguments = {});
  /// As call(), without waiting: `answered` is called once on the queue.
  void callAsync(const std::string& operation, const Array& arguments, std::function<void(const Answer&)> answered);
  /// Ends the connection; the end handler is called.
  void cancel();

 private:
  XTPlugInConnection(platform::UniqueFd socket, const platform::SerialQueue& queue);
  Answer serve(const platform::Value& call) const;
  /// Why the call is not to be sent; nothing when it is.
  std::optional<Error> faultOf(const std::string& operation, const Array& arguments) const;
  Answer answerIn(const std::string& operation, const platform::IpcReplyObject& reply) const;

  const platform::SerialQueue& queue_;
  const std::shared_ptr<platform::IpcConnection> connection_;
  // Set before resume(), read afterwards.
  Interface exported_;
  Interface remote_;
  Handler handler_;
  std::function<void()> ended_;
};

}  // namespace extora
