// HostServices: what a host does with the operating system rather than with the daemon, served under the platform's own
// name: launching plug-ins, consuming sandbox extensions, saying that one is busy. An embedded default for devices that
// have no launcher of their own.
//
// Events of one connection come in order on the threads of the IPC layer; launches are on their way on the launcher's
// thread meanwhile. Lives as long as somebody holds it; its connections do not.
#pragma once

#include <memory>
#include <string>

#include "platform/files/Directories.h"
#include "platform/hostservices/ExtensionHandles.h"
#include "platform/hostservices/Launcher.h"
#include "platform/ipc/IpcListener.h"
#include "platform/jobs/JobManager.h"
#include "platform/sandbox/Sandbox.h"
#include "platform/value/Error.h"

namespace platform {

class HostServices : public std::enable_shared_from_this<HostServices> {
 public:
  /// What they are made of.
  struct Options {
    Directories directories;
    std::shared_ptr<JobManager> jobs;
    std::shared_ptr<Sandbox> sandbox;
    Launcher::Programs programs = Launcher::Programs::installed();
  };

  /// Serves from resume() on. Null, and logged, when another process serves the name in that runtime directory, or the
  /// service cannot be made: the caller goes on without host services and launches.
  static std::shared_ptr<HostServices> make(Options options);
  ~HostServices();
  void resume();

  // For the connections (HostServicesClient).

  /// Starts what `host` is registered for; `done` is called once, on this thread or the launcher's.
  void launch(const std::shared_ptr<const PeerIdentity>& host, const std::string& executable,
              const Launcher::Done& done);
  JobManager& jobs() { return *options_.jobs; }
  Sandbox& sandbox() { return *options_.sandbox; }
  ExtensionHandles& handles() { return *handles_; }

 private:
  explicit HostServices(Options options);
  [[nodiscard]] std::optional<Launcher::Order> orderFor(JobManager::Launch launch, Launcher::Outcome* refusal) const;

  // Constant after construction.
  const Options options_;
  const std::shared_ptr<ExtensionHandles> handles_ = std::make_shared<ExtensionHandles>();
  Launcher launcher_;
  SerialQueue queue_{"host-services"};
  std::shared_ptr<IpcListener> listener_;
};

}  // namespace platform
