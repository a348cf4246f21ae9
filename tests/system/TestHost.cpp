// test_host: a host process that a test puts where it needs one (into a bundle, beside an entitlements file) and that
// passes on what it is told to ask (tests::Host).
//
//   test_host RUNTIME SERVICE
//
// connects to the daemon, then serves the connected socket that is its standard input: each request is sent to the
// daemon as its own, and its reply is the daemon's. Ends with its socket, or with status 1 when the daemon has gone.
#include <unistd.h>

#include "platform/ipc/IpcConnection.h"

using namespace platform;

int main(int argc, char* argv[]) {
  if (argc != 3) return 2;
  const SerialQueue events("events");
  const SerialQueue orders("orders");
  const auto daemon = ipcConnectService(argv[1], argv[2], events);
  daemon->setEventHandler([](const IpcEvent&) {});
  daemon->resume();
  const auto controller = ipcConnectionOverSocket(UniqueFd(STDIN_FILENO), orders);
  controller->setEventHandler([&](const IpcEvent& event) {
    const auto* order = std::get_if<IpcMessage>(&event);
    if (order == nullptr) ::_exit(0);
    const auto answer = daemon->sendWithReplySync(order->body);
    if (answer.error) ::_exit(1);
    IpcReply reply = ipcCreateReply(*order);
    reply.body = Dictionary(answer.body);
    controller->send(reply);
  });
  controller->resume();
  for (;;) ::pause();
}
