// JobManager: which host may launch which plug-in executable, and the running instances of launched plug-ins.
//
// A registration is held by the host's pidfd. It ends with the host process, when it is removed, or when the registry
// drops or replaces the bundle. An instance is tracked by pidfd and ends when its host ends. Ending an instance is
// SIGTERM, a grace period, SIGKILL. Callable from any thread; nothing here waits.
#pragma once

#include <sys/types.h>

#include <cerrno>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/PeerIdentity.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/Value.h"

namespace platform {

class JobManager {
 public:
  /// One running instance.
  struct Instance {
    std::string bundleIdentifier;
    std::string version;
    pid_t pid = 0;  ///< of the sandbox's first process
    bool busy = false;
  };

  /// What a host is about to start: its place on record, and what the registration says of it.
  struct Launch {
    std::uint64_t instance = 0;
    std::string executable;                ///< canonical
    std::string bundle;                    ///< canonical path of its bundle
    std::string container;                 ///< path of its data container; empty: it has none
    std::string profile;                   ///< name of its sandbox profile
    std::vector<std::string> environment;  ///< NAME=VALUE, all of it
  };

  /// The answer of a removal: 0 all instances have ended, 3 neither registration nor instance was on record, another
  /// number: the system error that kept an instance from being ended.
  static constexpr int kNoneOnRecord = 3;

  virtual ~JobManager() = default;

  /// Lets exactly the process `host` launch `executable` as an IPC service configured by `overlay`; a second
  /// registration of the same replaces the first. 0, or a system error number: ENOEXEC no executable regular file of a
  /// bundle, ENOENT a bundle that the registry does not have, EINVAL an overlay that cannot be used, ESRCH the host has
  /// gone.
  [[nodiscard]] virtual int jobAddExternalService(const std::shared_ptr<const PeerIdentity>& host,
                                                  const std::string& executable, const Value& overlay) = 0;

  /// Removes the registrations of a bundle identifier and version, ends their running instances, and calls `answer`
  /// once on `queue`.
  virtual void jobRemoveExternalService(const std::string& bundleIdentifier, const std::string& version,
                                        std::shared_ptr<SerialQueue> queue, std::function<void(int)> answer) = 0;

  /// The running instances of a bundle identifier (which may be empty: of bundles that have none), oldest first.
  virtual std::vector<Instance> instances(const std::string& bundleIdentifier) = 0;

  /// Ends every instance without waiting for it; for the end of the daemon.
  virtual void endAll() = 0;

  // For the host services, which launch. A job manager that has a launcher of its own has no use for these: through it
  // nothing is launched here.

  /// Begins a launch of `executable` by `host`; from here on it has a place among the host's instances, until
  /// instanceStarted or launchFailed says what became of it. Nothing and an error number: EPERM there is no
  /// registration of that executable for that very process, EAGAIN the host has as many instances as it may have.
  [[nodiscard]] virtual std::optional<Launch> beginLaunch(const std::shared_ptr<const PeerIdentity>& /*host*/,
                                                          const std::string& /*executable*/, int* errorNumber) {
    *errorNumber = EPERM;
    return std::nullopt;
  }
  /// The sandbox's first process runs and waits. 0: it is on record and may go on. EPERM: the registration or the host
  /// has ended meanwhile; the caller ends the process and then calls launchFailed.
  [[nodiscard]] virtual int instanceStarted(std::uint64_t /*instance*/, UniqueFd /*pidfd*/) { return EPERM; }
  /// Nothing of the launch is left. Without effect on an instance that has been put on record.
  virtual void launchFailed(std::uint64_t /*instance*/) {}
  /// The instance that `process` belongs to, known by its process-id namespace, or nothing.
  [[nodiscard]] virtual std::optional<std::uint64_t> instanceOf(const PeerIdentity& /*process*/) {
    return std::nullopt;
  }
  /// Counts the instance as busy once more, or once less; without effect when it has ended.
  virtual void setBusy(std::uint64_t /*instance*/, bool /*busy*/) {}
};

}  // namespace platform
