#include "Extora/XTPlugInConnection.h"

#include <fcntl.h>

#include <atomic>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "Extora/XTProtocol.h"

namespace extora {

using platform::Dictionary;
using platform::InterfaceDescription;
using platform::IpcError;
using platform::Value;
using Side = InterfaceDescription::Side;

namespace {

constexpr const char* kOperation = "operation";
constexpr const char* kArguments = "arguments";
constexpr const char* kDescriptorVariable = "EXTORA_IPC_FD";

Dictionary callOf(const std::string& operation, const platform::Array& arguments) {
  return {{kOperation, operation}, {kArguments, arguments}};
}

}  // namespace

std::shared_ptr<XTPlugInConnection> XTPlugInConnection::initWithSocket(platform::UniqueFd socket,
                                                                       const platform::SerialQueue& queue) {
  return std::shared_ptr<XTPlugInConnection>(new XTPlugInConnection(std::move(socket), queue));
}

std::shared_ptr<XTPlugInConnection> XTPlugInConnection::initForPlugIn(const platform::SerialQueue& queue) {
  static std::atomic<bool> taken = false;
  const char* const text = std::getenv(kDescriptorVariable);
  int descriptor = -1;
  if (text == nullptr || std::from_chars(text, text + std::strlen(text), descriptor).ec != std::errc()) return nullptr;
  if (::fcntl(descriptor, F_GETFD) < 0 || taken.exchange(true)) return nullptr;
  ::fcntl(descriptor, F_SETFD, FD_CLOEXEC);
  return initWithSocket(platform::UniqueFd(descriptor), queue);
}

XTPlugInConnection::XTPlugInConnection(platform::UniqueFd socket, const platform::SerialQueue& queue)
    : queue_(queue), connection_(platform::ipcConnectionOverSocket(std::move(socket), queue)) {}

XTPlugInConnection::~XTPlugInConnection() {
  connection_->cancel();
}

void XTPlugInConnection::exportInterface(Interface interface, Handler handler) {
  exported_ = std::move(interface);
  handler_ = std::move(handler);
}

void XTPlugInConnection::setRemoteInterface(Interface interface) {
  remote_ = std::move(interface);
}

void XTPlugInConnection::setEndHandler(std::function<void()> handler) {
  ended_ = std::move(handler);
}

void XTPlugInConnection::resume() {
  connection_->setEventHandler([weak = weak_from_this(), ended = ended_](const platform::IpcEvent& event) {
    if (const auto* error = std::get_if<IpcError>(&event)) {
      if (error->kind == IpcError::Kind::ConnectionInvalid && ended) ended();
      return;
    }
    const auto* call = std::get_if<platform::IpcMessage>(&event);
    const auto self = weak.lock();
    if (call == nullptr || self == nullptr) return;
    const Answer answer = self->serve(call->body);
    platform::IpcReply reply = platform::ipcCreateReply(*call);
    if (answer.error) {
      reply.body.set(XTDErrorCodeKey, static_cast<std::uint64_t>(answer.error->code));
      reply.body.set(XTDErrorKey, answer.error->localizedDescription());
    } else {
      reply.body.set(kArguments, answer.arguments);
    }
    self->connection_->send(reply);
  });
  connection_->resume();
}

XTPlugInConnection::Answer XTPlugInConnection::serve(const Value& call) const {
  const Value& operation = call[kOperation];
  const Value& arguments = call[kArguments];
  if (!operation.isString()) return {{}, makeError(XTErrorInterface, "the message names no operation")};
  if (!arguments.isArray()) return {{}, makeError(XTErrorInterface, "the message has no array of arguments")};
  if (!handler_) return {{}, makeError(XTErrorInterface, "nothing is offered on this side of the connection")};
  if (exported_ != nullptr) {
    if (const auto fault = exported_->faultOf(operation.string(), Side::Request, arguments)) {
      return {{}, makeError(XTErrorInterface, *fault)};
    }
  }
  Answer answer = handler_(operation.string(), Array(arguments));
  // What has no code would not be an error on the wire.
  if (answer.error && answer.error->code == 0) answer.error->code = XTErrorRequest;
  return answer;
}

std::optional<Error> XTPlugInConnection::faultOf(const std::string& operation, const Array& arguments) const {
  if (remote_ == nullptr) return std::nullopt;
  const auto fault = remote_->faultOf(operation, Side::Request, arguments);
  return fault ? std::optional(makeError(XTErrorInterface, *fault)) : std::nullopt;
}

XTPlugInConnection::Answer XTPlugInConnection::answerIn(const std::string& operation,
                                                        const platform::IpcReplyObject& reply) const {
  if (reply.error) return {{}, makeError(XTErrorRequest, reply.error->describe())};
  const std::uint64_t code = reply.body[XTDErrorCodeKey].exactUnsigned();
  const Value& text = reply.body[XTDErrorKey];
  if (code != 0 || text.isString()) {
    return {{},
            makeError(code != 0 ? static_cast<std::int64_t>(code) : static_cast<std::int64_t>(XTErrorRequest),
                      text.isString() ? text.string() : "the other side gave no reason")};
  }
  const Value& arguments = reply.body[kArguments];
  if (!arguments.isArray()) return {{}, makeError(XTErrorInterface, "the answer has no array of arguments")};
  if (remote_ != nullptr) {
    if (const auto fault = remote_->faultOf(operation, Side::Reply, arguments)) {
      return {{}, makeError(XTErrorInterface, *fault)};
    }
  }
  return {Array(arguments), std::nullopt};
}

XTPlugInConnection::Answer XTPlugInConnection::call(const std::string& operation, const Array& arguments) {
  if (auto fault = faultOf(operation, arguments)) return {{}, std::move(fault)};
  return answerIn(operation, connection_->sendWithReplySync(callOf(operation, arguments)));
}

void XTPlugInConnection::callAsync(const std::string& operation, const Array& arguments,
                                   std::function<void(const Answer&)> answered) {
  if (auto fault = faultOf(operation, arguments)) {
    queue_.async([answered = std::move(answered), answer = Answer{{}, std::move(fault)}] { answered(answer); });
    return;
  }
  connection_->sendWithReply(
      callOf(operation, arguments), queue_,
      [self = shared_from_this(), operation, answered = std::move(answered)](const platform::IpcReplyObject& reply) {
        answered(self->answerIn(operation, reply));
      });
}

void XTPlugInConnection::cancel() {
  connection_->cancel();
}

}  // namespace extora
