#include "platform/hostservices/HostServices.h"

#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/hostservices/HostServicesClient.h"
#include "platform/hostservices/HostServicesProtocol.h"
#include "platform/hostservices/LaunchProfile.h"
#include "platform/hostservices/SandboxOptions.h"
#include "platform/ipc/IpcServiceAddress.h"
#include "platform/log/Log.h"

namespace platform {
namespace {

// Whom to become for a plug-in; nothing and no refusal: nobody else. A plug-in never runs as root.
std::optional<UserAndGroup> plugInUser(const std::string& name, Launcher::Outcome* refusal) {
  const uid_t self = ::geteuid();
  if (self != 0 && name.empty()) return std::nullopt;
  const auto user = UserAndGroup::named(name);
  if (!user) {
    *refusal = {EPERM, "there is no user \"" + name + "\" for plug-ins to run as", 0, {}};
  } else if (user->user == 0) {
    *refusal = {EPERM, "plug-ins do not run as root", 0, {}};
  } else if (self != 0 && user->user != self) {
    *refusal = {EPERM, "this daemon cannot run plug-ins as user " + name, 0, {}};
  } else if (self == 0) {
    return user;
  }
  return std::nullopt;
}

}  // namespace

std::shared_ptr<HostServices> HostServices::make(Options options) {
  std::shared_ptr<HostServices> services(new HostServices(std::move(options)));
  Error error;
  services->listener_ =
      ipcCreateListener(services->options_.directories.runtime, kHostServices, services->queue_, &error);
  if (services->listener_ == nullptr) {
    const char* why = error.code == EADDRINUSE ? "is served already" : "cannot be served";
    Log::processDefault().error("{} {}: no host services and no launches here ({})", kHostServices, why, error);
    return nullptr;
  }
  services->listener_->setEventHandler([weak = services->weak_from_this()](const IpcEvent& event) {
    if (const auto* connection = std::get_if<std::shared_ptr<IpcConnection>>(&event)) {
      HostServicesClient::serve(*connection, weak);
    } else if (const auto* problem = std::get_if<IpcError>(&event);
               problem != nullptr && problem->kind != IpcError::Kind::ConnectionInvalid) {
      Log::processDefault().error("{}: {}", kHostServices, *problem);
    }
  });
  return services;
}

HostServices::HostServices(Options options)
    : options_(std::move(options)), launcher_(options_.jobs, options_.programs) {}

HostServices::~HostServices() {
  if (listener_ != nullptr) listener_->cancel();
}

void HostServices::resume() {
  listener_->resume();
}

void HostServices::launch(const std::shared_ptr<const PeerIdentity>& host, const std::string& executable,
                          const Launcher::Done& done) {
  Launcher::Outcome refusal;
  auto launch = options_.jobs->beginLaunch(host, executable, &refusal.errorNumber);
  if (!launch) {
    refusal.reason = refusal.errorNumber == EAGAIN ? "it has too many instances" : "it is not registered for it";
    Log::processDefault().def("denied launch of {} to {}: {}", executable, host->pid(), refusal.reason);
    done(std::move(refusal));
    return;
  }
  const std::uint64_t instance = launch->instance;
  if (auto order = orderFor(std::move(*launch), &refusal)) {
    launcher_.launch(std::move(*order), done);
    return;
  }
  options_.jobs->launchFailed(instance);
  Log::processDefault().error("cannot launch {}: {}", executable, refusal.reason);
  done(std::move(refusal));
}

std::optional<Launcher::Order> HostServices::orderFor(JobManager::Launch launch, Launcher::Outcome* refusal) const {
  const Directories& directories = options_.directories;
  Launcher::Order order;
  order.user = plugInUser(directories.plugInUser, refusal);
  if (refusal->errorNumber != 0) return std::nullopt;
  Error error;
  const auto profile = LaunchProfile::read(directories.profiles, launch.profile, &error);
  if (!profile) {
    *refusal = {static_cast<int>(error.code), error.localizedDescription(), 0, {}};
    return std::nullopt;
  }
  const std::string socket = ipcServicesDirectory(directories.runtime) + "/" + kHostServices;
  order.options = sandboxOptions(launch, *profile, socket);
  order.launch = std::move(launch);
  return order;
}

}  // namespace platform
