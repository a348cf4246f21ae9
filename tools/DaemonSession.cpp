#include "tools/DaemonSession.h"

#include <fmt/format.h>

#include <future>

#include "platform/files/Directories.h"
#include "tools/Command.h"

namespace tools {

using extora::XTDaemonClient;
using platform::IpcReplyObject;
using platform::Value;

IpcReplyObject DaemonSession::request(const Send& send) {
  if (!client_) client_ = XTDaemonClient::initWithServiceName(service_);
  // Shared with the reply function, which may still be returning when the answer has been taken.
  auto promise = std::make_shared<std::promise<IpcReplyObject>>();
  auto answer = promise->get_future();
  send(*client_, [promise](const IpcReplyObject& object) { promise->set_value(object); });
  return answer.get();
}

ExitStatus DaemonSession::ask(const Send& send, Value& reply, const std::string& hint) {
  const IpcReplyObject object = request(send);
  if (object.error) {
    // A failed connection names the socket that was tried; one that broke later does not.
    const std::string socket = platform::Directories::forClient(service_).runtime + "/services/" + service_;
    const bool named = object.error->text.find(socket) != std::string::npos;
    complain(fmt::format("the daemon cannot be reached: {}{}", object.error->text, named ? "" : " (" + socket + ")"));
    return ExitStatus::Unreachable;
  }
  if (const auto error = XTDaemonClient::errorInReply(object)) {
    complain(fmt::format("the daemon refused: {} (code {})", error->localizedDescription(), error->code));
    if (error->code == extora::XTErrorNotPermitted && !hint.empty()) complain(hint);
    return ExitStatus::Refused;
  }
  reply = object.body;
  return ExitStatus::Success;
}

ExitStatus DaemonSession::match(const platform::Dictionary& rules, std::uint64_t flags, Value& forms) {
  Value reply;
  const ExitStatus status = ask([&](auto& client, const auto& answer) { client.matchPlugIns(rules, flags, answer); },
                                reply, (flags & extora::XTDiscoverAll) != 0 ? kManagersOnly : "");
  if (status == ExitStatus::Success) forms = matches(reply);
  return status;
}

Value DaemonSession::matches(const Value& reply) const {
  return client_ ? client_->convertFromIPC(reply[extora::XTDMatchesKey]) : Value();
}

}  // namespace tools
