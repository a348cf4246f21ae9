// HostServicesClient: one connection to the host services: reads each request, and answers it once.
//
// A refusal carries "errno" and "error". Events come in order, one at a time; the answer to a launch is sent from the
// launcher's thread. Kept by its connection until the last event.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>

#include "platform/hostservices/HostServices.h"
#include "platform/ipc/IpcConnection.h"

namespace platform {

class HostServicesClient {
 public:
  /// Serves `connection` from here on, for as long as the services live.
  static void serve(const std::shared_ptr<IpcConnection>& connection, std::weak_ptr<HostServices> services);

 private:
  using Operation = void (HostServicesClient::*)(HostServices&, const Value&, IpcReply);
  struct NamedOperation;
  static const NamedOperation kOperations[];

  HostServicesClient(const std::shared_ptr<IpcConnection>& connection, std::weak_ptr<HostServices> services);
  void handle(const IpcEvent& event);
  void handleRequest(HostServices& services, const IpcMessage& message);
  void launch(HostServices& services, const Value& request, IpcReply reply);
  void consume(HostServices& services, const Value& request, IpcReply reply);
  void release(HostServices& services, const Value& request, IpcReply reply);
  void beginActivity(HostServices& services, const Value& request, IpcReply reply);
  void endActivity(HostServices& services, const Value& request, IpcReply reply);
  void answer(const IpcReply& reply) const;
  void refuse(IpcReply reply, int errorNumber, const std::string& reason) const;

  const std::weak_ptr<IpcConnection> connection_;
  const std::shared_ptr<const PeerIdentity> peer_;
  const std::weak_ptr<HostServices> services_;
  // What this connection has begun and not ended; used by its events alone.
  std::optional<std::uint64_t> instance_;
  std::size_t activities_ = 0;
};

}  // namespace platform
