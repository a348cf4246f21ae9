#include "Extora/XTHostServices.h"

#include <fcntl.h>

#include <cerrno>
#include <memory>

#include "platform/files/Directories.h"
#include "platform/hostservices/HostServicesProtocol.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace extora {
namespace {

using platform::Dictionary;
using platform::IpcConnection;
using platform::UniqueFd;
using platform::Value;

// The process's connection. Never destroyed: activities last as long as it does, and threads may use it to the end.
struct Shared {
  platform::Mutex mutex;
  std::shared_ptr<IpcConnection> connection XT_GUARDED_BY(mutex);
  platform::SerialQueue events{"host_services"};
};

// `made` says whether it was made just now.
std::shared_ptr<IpcConnection> sharedConnection(bool* made) {
  static auto* const shared = new Shared;
  const platform::MutexLock lock(shared->mutex);
  *made = shared->connection == nullptr || !shared->connection->isValid();
  if (*made) {
    const std::string runtime = platform::Directories::forClient(platform::kHostServices).runtime;
    shared->connection = platform::ipcConnectService(runtime, platform::kHostServices, shared->events);
    shared->connection->setEventHandler([](const platform::IpcEvent&) {});  // requests come back with what is wrong
    shared->connection->resume();
  }
  return shared->connection;
}

// The answer, or nothing and `error`.
Value ask(const Dictionary& request, Error* error) {
  bool made = false;
  platform::IpcReplyObject reply = sharedConnection(&made)->sendWithReplySync(request);
  // That the service has been started anew since the last request shows with the next one. What the one before had
  // begun ended with it.
  if (reply.error && !made) reply = sharedConnection(&made)->sendWithReplySync(request);
  if (reply.error) {
    platform::setError(error, {"POSIX", ENOTCONN, reply.error->describe()});
    return {};
  }
  const std::uint64_t number = reply.body[platform::kErrnoKey].exactUnsigned();
  if (number == 0) return reply.body;
  platform::setError(error, {"POSIX", static_cast<std::int64_t>(number), reply.body[platform::kErrorKey].string()});
  return {};
}

// A request whose answer holds nothing.
std::optional<Error> tell(const Dictionary& request) {
  Error error;
  if (ask(request, &error).isNothing()) return error;
  return std::nullopt;
}

// A descriptor of the caller's own; empty when there is none.
UniqueFd ownDescriptor(const Value& value) {
  return UniqueFd(value.isDescriptor() ? ::fcntl(value.descriptor(), F_DUPFD_CLOEXEC, 0) : -1);
}

}  // namespace

std::optional<XTHostServices::Launched> XTHostServices::launch(const std::string& executable, Error* error) {
  const Value answer =
      ask({{platform::kOperationKey, platform::kLaunchOperation}, {platform::kExecutableKey, executable}}, error);
  if (answer.isNothing()) return std::nullopt;
  return Launched{static_cast<pid_t>(answer[platform::kPidKey].exactUnsigned()),
                  ownDescriptor(answer[platform::kConnectionKey])};
}

std::optional<XTHostServices::Consumed> XTHostServices::consume(const std::string& token, Error* error) {
  const Value answer =
      ask({{platform::kOperationKey, platform::kConsumeOperation}, {platform::kTokenKey, token}}, error);
  if (answer.isNothing()) return std::nullopt;
  return Consumed{answer[platform::kHandleKey].exactSigned(), ownDescriptor(answer[platform::kDescriptorKey])};
}

std::optional<Error> XTHostServices::release(std::int64_t handle) {
  return tell({{platform::kOperationKey, platform::kReleaseOperation}, {platform::kHandleKey, handle}});
}

std::optional<Error> XTHostServices::beginActivity() {
  return tell({{platform::kOperationKey, platform::kBeginActivityOperation}});
}

std::optional<Error> XTHostServices::endActivity() {
  return tell({{platform::kOperationKey, platform::kEndActivityOperation}});
}

}  // namespace extora
