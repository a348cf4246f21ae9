#include "platform/hostservices/HostServicesClient.h"

#include <cerrno>
#include <cstring>
#include <string_view>
#include <utility>

#include "platform/hostservices/GrantedPlace.h"
#include "platform/hostservices/HostServicesProtocol.h"
#include "platform/log/Log.h"

namespace platform {

struct HostServicesClient::NamedOperation {
  std::string_view name;
  Operation serve;
};

const HostServicesClient::NamedOperation HostServicesClient::kOperations[] = {
    {kLaunchOperation, &HostServicesClient::launch},
    {kConsumeOperation, &HostServicesClient::consume},
    {kReleaseOperation, &HostServicesClient::release},
    {kBeginActivityOperation, &HostServicesClient::beginActivity},
    {kEndActivityOperation, &HostServicesClient::endActivity},
};

void HostServicesClient::serve(const std::shared_ptr<IpcConnection>& connection, std::weak_ptr<HostServices> services) {
  const std::shared_ptr<HostServicesClient> client(new HostServicesClient(connection, std::move(services)));
  connection->setEventHandler([client](const IpcEvent& event) { client->handle(event); });
  connection->resume();
}

HostServicesClient::HostServicesClient(const std::shared_ptr<IpcConnection>& connection,
                                       std::weak_ptr<HostServices> services)
    : connection_(connection), peer_(connection->peer()), services_(std::move(services)) {}

void HostServicesClient::handle(const IpcEvent& event) {
  const auto services = services_.lock();
  if (const auto* message = std::get_if<IpcMessage>(&event)) {
    if (services != nullptr) {
      handleRequest(*services, *message);
    } else if (const auto connection = connection_.lock()) {
      connection->cancel();
    }
    return;
  }
  const auto* error = std::get_if<IpcError>(&event);
  if (error == nullptr || error->kind != IpcError::Kind::ConnectionInvalid || services == nullptr) return;
  for (; activities_ != 0; --activities_) services->jobs().setBusy(*instance_, false);
}

void HostServicesClient::handleRequest(HostServices& services, const IpcMessage& message) {
  if (!message.body.isDictionary()) {
    Log::processDefault().error("unexpected message to {}: {}", kHostServices, message.body);
    return;
  }
  const std::string& name = message.body[kOperationKey].string();
  IpcReply reply = ipcCreateReply(message);
  for (const auto& operation : kOperations) {
    if (operation.name == name) return (this->*operation.serve)(services, message.body, std::move(reply));
  }
  refuse(std::move(reply), EINVAL, "there is no operation \"" + name + "\"");
}

void HostServicesClient::launch(HostServices& services, const Value& request, IpcReply reply) {
  const std::string& executable = request[kExecutableKey].string();
  if (executable.empty()) return refuse(std::move(reply), EINVAL, "\"executable\" is missing");
  services.launch(peer_, executable, [weak = connection_, reply](Launcher::Outcome outcome) {
    const auto connection = weak.lock();
    if (connection == nullptr) return;
    IpcReply answer = reply;
    if (outcome.errorNumber != 0) {
      answer.body.set(kErrnoKey, static_cast<std::uint64_t>(outcome.errorNumber));
      answer.body.set(kErrorKey, outcome.reason);
    } else {
      answer.body.set(kPidKey, static_cast<std::uint64_t>(outcome.pid));
      answer.body.set(kConnectionKey, Value::descriptor(std::move(outcome.connection)));
    }
    connection->send(answer);
  });
}

void HostServicesClient::consume(HostServices& services, const Value& request, IpcReply reply) {
  int number = 0;
  const auto grant = services.sandbox().verifyExtension(request[kTokenKey].string(), &number);
  if (!grant) return refuse(std::move(reply), number, "the token is not sound");
  UniqueFd place;
  if (grant->extensionClass == kFileReadExtensionClass) {
    place = openGrantedPlace(*grant, &number);
    if (!place)
      return refuse(std::move(reply), number,
                    std::string("cannot open what the token grants: ") + std::strerror(number));
  } else if (grant->extensionClass != kPlugInServiceExtensionClass) {
    return refuse(std::move(reply), EACCES, "the token is of a class that is not consumed here");
  }
  const std::int64_t handle = services.handles().add(peer_, &number);
  if (handle < 0) return refuse(std::move(reply), number, std::strerror(number));
  reply.body.set(kHandleKey, handle);
  if (place) reply.body.set(kDescriptorKey, Value::descriptor(std::move(place)));
  answer(reply);
}

void HostServicesClient::release(HostServices& services, const Value& request, IpcReply reply) {
  if (!services.handles().remove(*peer_, request[kHandleKey].exactSigned())) {
    return refuse(std::move(reply), EINVAL, "this process has no such handle");
  }
  answer(reply);
}

void HostServicesClient::beginActivity(HostServices& services, const Value&, IpcReply reply) {
  if (!instance_) instance_ = services.jobs().instanceOf(*peer_);
  if (!instance_) return refuse(std::move(reply), EPERM, "this process is no instance of a plug-in");
  services.jobs().setBusy(*instance_, true);
  ++activities_;
  answer(reply);
}

void HostServicesClient::endActivity(HostServices& services, const Value&, IpcReply reply) {
  if (!instance_) instance_ = services.jobs().instanceOf(*peer_);
  if (!instance_) return refuse(std::move(reply), EPERM, "this process is no instance of a plug-in");
  if (activities_ != 0) {
    services.jobs().setBusy(*instance_, false);
    --activities_;
  }
  answer(reply);
}

void HostServicesClient::answer(const IpcReply& reply) const {
  if (const auto connection = connection_.lock()) connection->send(reply);
}

void HostServicesClient::refuse(IpcReply reply, int errorNumber, const std::string& reason) const {
  reply.body.set(kErrnoKey, static_cast<std::uint64_t>(errorNumber));
  reply.body.set(kErrorKey, reason);
  answer(reply);
}

}  // namespace platform
