// A plug-in's executable: serves the host that it was started for. It is given one end of a connection as descriptor
// EXTORA_IPC_FD, answers every request with its own words, and ends when the host has gone.
#include <cstdio>
#include <cstdlib>
#include <future>
#include <memory>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/queue/SerialQueue.h"

int main() {
  const char* descriptor = std::getenv("EXTORA_IPC_FD");
  if (descriptor == nullptr) {
    std::fputs("A plug-in is not run by hand: a host asks for it, and it is started for that host.\n", stderr);
    return 2;
  }

  static const platform::SerialQueue queue("plug-in");
  std::promise<void> hostHasGone;
  const auto connection = platform::ipcConnectionOverSocket(platform::UniqueFd(std::atoi(descriptor)), queue);
  connection->setEventHandler([&](const platform::IpcEvent& event) {
    if (const auto* request = std::get_if<platform::IpcMessage>(&event)) {
      platform::IpcReply reply = platform::ipcCreateReply(*request);
      reply.body.set("says", "Miaow.");
      reply.body.set("heard", request->body);
      connection->send(reply);
    } else if (const auto* error = std::get_if<platform::IpcError>(&event)) {
      if (error->kind == platform::IpcError::Kind::ConnectionInvalid) hostHasGone.set_value();
    }
  });
  connection->resume();
  hostHasGone.get_future().wait();
  return 0;
}
