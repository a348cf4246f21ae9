#include "platform/ipc/IpcMessage.h"

#include "platform/ipc/IpcConnection.h"

namespace platform {

void IpcTicket::serve() noexcept {
  if (served_.exchange(true)) return;
  if (const auto counter = counter_.lock()) counter->requestServed();
}

std::string describe(const IpcEvent& event) {
  if (const auto* message = std::get_if<IpcMessage>(&event)) return message->body.describe();
  if (const auto* error = std::get_if<IpcError>(&event)) return error->describe();
  const auto& connection = std::get<std::shared_ptr<IpcConnection>>(event);
  return connection ? connection->describe() : "no connection";
}

}  // namespace platform
