#include "platform/ipc/IpcConnection.h"

#include <fmt/format.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "platform/ipc/IpcServiceAddress.h"
#include "platform/ipc/IpcSocketConnection.h"

namespace platform {

std::shared_ptr<IpcConnection> ipcConnectService(const std::string& runtimeDirectory, const std::string& service,
                                                 const SerialQueue& targetQueue) {
  IpcSocketConnection::Settings settings;
  settings.name = service;
  settings.targetQueue = QueueReference(targetQueue);
  const std::string directory = ipcServicesDirectory(runtimeDirectory);
  const auto failed = [&](const std::string& why) {
    return IpcSocketConnection::makeFailed(fmt::format("cannot connect to {}/{}: {}", directory, service, why),
                                           settings);
  };
  Error error;
  const auto address = IpcServiceAddress::make(directory, service, &error);
  if (!address) return failed(error.localizedDescription());
  UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket) return failed(std::strerror(errno));
  while (::connect(socket.get(), address->address(), address->size()) != 0) {
    if (errno != EINTR) return failed(std::strerror(errno));
  }
  auto peer = PeerIdentity::ofSocket(socket.get());
  return IpcSocketConnection::make(std::move(socket), std::move(peer), std::move(settings));
}

std::shared_ptr<IpcConnection> ipcConnectionOverSocket(UniqueFd socket, const SerialQueue& targetQueue) {
  IpcSocketConnection::Settings settings;
  settings.name = "socket";
  settings.targetQueue = QueueReference(targetQueue);
  auto peer = PeerIdentity::ofSocket(socket.get());
  return IpcSocketConnection::make(std::move(socket), std::move(peer), std::move(settings));
}

}  // namespace platform
