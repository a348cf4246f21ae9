// ProcessJobManager: the job manager over Linux processes.
//
// 1. Everything it knows is on its own serial queue "jobs".
// 2. Hosts and instances are watched through their pidfds on the main run loop, which only hands the event over.
// 3. One timer serves every termination that waits: it fires at the earliest end of a grace period.
// 4. A registration remembers the registry's UUID of the plug-in and counts only while the registry has that very one.
// 5. An instance has its place on record from the beginning of its launch, so that neither the bound nor a removal can
//    miss one that is just being started: it is ended as soon as it could run.
#pragma once

#include <chrono>
#include <list>
#include <map>
#include <string>
#include <vector>

#include "platform/jobs/FdWatch.h"
#include "platform/jobs/JobManager.h"
#include "platform/jobs/LaunchOverlay.h"
#include "platform/registry/ApplicationRegistry.h"

namespace platform {

class ProcessJobManager : public JobManager, public std::enable_shared_from_this<ProcessJobManager> {
 public:
  /// Most instances of one host, those that are being launched counted.
  static constexpr std::size_t kInstancesPerHost = 16;

  /// `graceMs`: milliseconds between SIGTERM and SIGKILL.
  static std::shared_ptr<ProcessJobManager> make(const std::shared_ptr<ApplicationRegistry>& registry,
                                                 std::uint64_t graceMs);
  /// EXTORA_TERMINATION_GRACE_MS, else 5,000.
  static std::uint64_t graceFromEnvironment();
  ~ProcessJobManager() override;

  [[nodiscard]] int jobAddExternalService(const std::shared_ptr<const PeerIdentity>& host,
                                          const std::string& executable, const Value& overlay) override;
  void jobRemoveExternalService(const std::string& bundleIdentifier, const std::string& version,
                                std::shared_ptr<SerialQueue> queue, std::function<void(int)> answer) override;
  std::vector<Instance> instances(const std::string& bundleIdentifier) override;
  void endAll() override;

  [[nodiscard]] std::optional<Launch> beginLaunch(const std::shared_ptr<const PeerIdentity>& host,
                                                  const std::string& executable, int* errorNumber) override;
  [[nodiscard]] int instanceStarted(std::uint64_t instance, UniqueFd pidfd) override;
  void launchFailed(std::uint64_t instance) override;
  [[nodiscard]] std::optional<std::uint64_t> instanceOf(const PeerIdentity& process) override;
  void setBusy(std::uint64_t instance, bool busy) override;

 private:
  struct Registration {
    std::shared_ptr<const PeerIdentity> host;
    std::string executable;
    std::string bundle;
    std::string bundleIdentifier;
    std::string version;
    std::optional<Uuid> plugIn;
    LaunchOverlay overlay;
  };
  struct HostWatch {
    std::shared_ptr<const PeerIdentity> host;
    std::unique_ptr<FdWatch> watch;
  };
  struct Running {
    std::shared_ptr<const PeerIdentity> host;
    std::string bundleIdentifier;
    std::string version;
    std::shared_ptr<const PeerIdentity> process;  // null while it is being launched
    std::size_t busyCount = 0;
    bool ending = false;
    bool killed = false;
    std::chrono::steady_clock::time_point killAt;
    std::unique_ptr<FdWatch> watch;
  };
  struct Removal {
    std::vector<std::uint64_t> waitingFor;
    int failure = 0;
    std::shared_ptr<SerialQueue> queue;
    std::function<void(int)> answer;
  };

  ProcessJobManager(const std::shared_ptr<ApplicationRegistry>& registry, std::uint64_t graceMs);
  PlugInRecord recordAt(const std::string& bundle) const;
  PlugInRecord currentRecord(const Registration& registration) const;
  void watchHost(const std::shared_ptr<const PeerIdentity>& host) XT_REQUIRES(queue_);
  void hostEnded(pid_t pid) XT_REQUIRES(queue_);
  void sweepDeadHosts() XT_REQUIRES(queue_);
  int endInstance(Running& instance) XT_REQUIRES(queue_);
  void instanceEnded(std::uint64_t id) XT_REQUIRES(queue_);
  void graceOver() XT_REQUIRES(queue_);
  void armTimer() XT_REQUIRES(queue_);
  std::unique_ptr<FdWatch> watch(int fd, std::function<void(ProcessJobManager&)> work);

  // Constant after construction.
  const std::weak_ptr<ApplicationRegistry> registry_;  // it belongs to the main thread
  const std::chrono::milliseconds grace_;
  UniqueFd timer_;
  std::unique_ptr<FdWatch> timerWatch_;

  SerialQueue queue_{"jobs"};
  std::uint64_t nextId_ XT_GUARDED_BY(queue_) = 1;
  std::vector<Registration> registrations_ XT_GUARDED_BY(queue_);
  std::map<pid_t, HostWatch> hosts_ XT_GUARDED_BY(queue_);
  std::map<std::uint64_t, Running> running_ XT_GUARDED_BY(queue_);  // oldest first
  std::list<Removal> removals_ XT_GUARDED_BY(queue_);
};

}  // namespace platform
