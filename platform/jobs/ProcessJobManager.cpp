#include "platform/jobs/ProcessJobManager.h"

#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <string_view>

#include "platform/bundle/PlatformBundle.h"

namespace platform {
namespace {

constexpr std::uint64_t kDefaultGraceMs = 5000;
constexpr std::uint64_t kLongestGraceMs = 86'400'000;

int signalProcess(const PeerIdentity& process, int signal) {
  return syscall(SYS_pidfd_send_signal, process.pidfd(), signal, nullptr, 0) == 0 ? 0 : errno;
}

// Both live at this moment, so that one process id cannot be two processes.
bool sameProcess(const PeerIdentity& a, const PeerIdentity& b) {
  return a.pid() == b.pid() && a.isAlive() && b.isAlive();
}

std::optional<std::string> canonical(const std::string& path) {
  const std::unique_ptr<char, decltype(&free)> resolved(realpath(path.c_str(), nullptr), &free);
  return resolved == nullptr ? std::nullopt : std::optional<std::string>(resolved.get());
}

bool isExecutableFile(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) && access(path.c_str(), X_OK) == 0;
}

// The inode that names a process-id namespace; 0 when it cannot be looked at.
ino_t namespaceAt(const std::string& process) {
  struct stat status {};
  return stat(("/proc/" + process + "/ns/pid").c_str(), &status) == 0 ? status.st_ino : 0;
}

// The process-id namespace of a live process, unless it is this process's own.
std::optional<ino_t> foreignNamespace(const PeerIdentity& process) {
  const ino_t inode = namespaceAt(std::to_string(process.pid()));
  if (inode == 0 || !process.isAlive() || inode == namespaceAt("self")) return std::nullopt;
  return inode;
}

}  // namespace

std::uint64_t ProcessJobManager::graceFromEnvironment() {
  const char* variable = std::getenv("EXTORA_TERMINATION_GRACE_MS");
  const std::string_view text = variable != nullptr ? variable : "";
  std::uint64_t milliseconds = 0;
  const auto [end, bad] = std::from_chars(text.data(), text.data() + text.size(), milliseconds);
  if (bad != std::errc() || end != text.data() + text.size()) return kDefaultGraceMs;
  return std::min(milliseconds, kLongestGraceMs);
}

std::shared_ptr<ProcessJobManager> ProcessJobManager::make(const std::shared_ptr<ApplicationRegistry>& registry,
                                                           std::uint64_t graceMs) {
  std::shared_ptr<ProcessJobManager> manager(new ProcessJobManager(registry, graceMs));
  manager->timerWatch_ = manager->watch(manager->timer_.get(), [](ProcessJobManager& self) {
    self.queue_.assertOnQueue();
    self.graceOver();
  });
  return manager;
}

ProcessJobManager::ProcessJobManager(const std::shared_ptr<ApplicationRegistry>& registry, std::uint64_t graceMs)
    : registry_(registry), grace_(graceMs), timer_(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)) {}

ProcessJobManager::~ProcessJobManager() = default;

// The main thread only hands the event over; an event for a manager that has gone is dropped.
std::unique_ptr<FdWatch> ProcessJobManager::watch(int fd, std::function<void(ProcessJobManager&)> work) {
  return std::make_unique<FdWatch>(fd, [weak = weak_from_this(), work = std::move(work)] {
    auto self = weak.lock();
    if (self == nullptr) return;
    const SerialQueue& queue = self->queue_;
    queue.async([self = std::move(self), work] { work(*self); });
  });
}

// Registrations.

int ProcessJobManager::jobAddExternalService(const std::shared_ptr<const PeerIdentity>& host,
                                             const std::string& executable, const Value& overlay) {
  const auto path = canonical(executable);
  if (!path || !isExecutableFile(*path)) return ENOEXEC;
  const auto bundle = PlatformBundle::create(*path, PlatformBundle::PathKind::Executable)
                          ->property(PlatformBundle::Property::BundlePath);
  if (!bundle) return ENOEXEC;
  const PlugInRecord record = recordAt(*bundle);
  if (record == nullptr) return ENOENT;
  auto parsed = LaunchOverlay::parse(overlay);
  if (!parsed) return EINVAL;
  if (!host->isAlive()) return ESRCH;

  const Value& version = record->infoDictionary["HBBundleVersion"];
  Registration registration{host,
                            *path,
                            *bundle,
                            record->bundleIdentifier,
                            version.isString() ? version.string() : "1",
                            record->plugInUUID,
                            std::move(*parsed)};
  queue_.sync([&] {
    queue_.assertOnQueue();
    auto same = std::find_if(registrations_.begin(), registrations_.end(), [&](const Registration& other) {
      return other.executable == registration.executable && sameProcess(*other.host, *host);
    });
    if (same != registrations_.end()) {
      *same = std::move(registration);
    } else {
      registrations_.push_back(std::move(registration));
    }
    watchHost(host);
  });
  return 0;
}

PlugInRecord ProcessJobManager::recordAt(const std::string& bundle) const {
  const auto registry = registry_.lock();
  return registry == nullptr ? nullptr : registry->registryPlugInByURL(Url::file(bundle));
}

// The record of the very plug-in that was registered; null when the registry has dropped or replaced it.
PlugInRecord ProcessJobManager::currentRecord(const Registration& registration) const {
  PlugInRecord record = recordAt(registration.bundle);
  return record != nullptr && record->plugInUUID == registration.plugIn ? record : nullptr;
}

void ProcessJobManager::jobRemoveExternalService(const std::string& bundleIdentifier, const std::string& version,
                                                 std::shared_ptr<SerialQueue> queue, std::function<void(int)> answer) {
  queue_.async([this, self = shared_from_this(), bundleIdentifier, version, queue = std::move(queue),
                answer = std::move(answer)]() mutable {
    queue_.assertOnQueue();
    bool onRecord = false;
    std::erase_if(registrations_, [&](const Registration& registration) {
      if (registration.bundleIdentifier != bundleIdentifier || registration.version != version) return false;
      onRecord = onRecord || (registration.host->isAlive() && currentRecord(registration) != nullptr);
      return true;
    });

    Removal removal;
    for (auto& [id, instance] : running_) {
      if (instance.bundleIdentifier != bundleIdentifier || instance.version != version) continue;
      onRecord = true;
      if (const int failure = endInstance(instance); failure != 0) {
        removal.failure = failure;
      } else {
        removal.waitingFor.push_back(id);
      }
    }
    if (removal.waitingFor.empty()) {
      const int result = removal.failure != 0 ? removal.failure : onRecord ? 0 : kNoneOnRecord;
      const SerialQueue& target = *queue;
      target.async([queue = std::move(queue), answer = std::move(answer), result] { answer(result); });
      return;
    }
    removal.queue = std::move(queue);
    removal.answer = std::move(answer);
    removals_.push_back(std::move(removal));
    armTimer();
  });
}

// Hosts.

void ProcessJobManager::watchHost(const std::shared_ptr<const PeerIdentity>& host) {
  auto& entry = hosts_[host->pid()];
  if (entry.host != nullptr && sameProcess(*entry.host, *host)) return;
  const bool replaces = entry.host != nullptr;
  entry.host = host;
  entry.watch = watch(host->pidfd(), [pid = host->pid()](ProcessJobManager& self) {
    self.queue_.assertOnQueue();
    self.hostEnded(pid);
  });
  // The process id is another process's by now, and the event of its former owner's end will not be taken.
  if (replaces) sweepDeadHosts();
}

void ProcessJobManager::hostEnded(pid_t pid) {
  auto entry = hosts_.find(pid);
  if (entry == hosts_.end() || entry->second.host->isAlive()) return;
  hosts_.erase(entry);
  sweepDeadHosts();
}

void ProcessJobManager::sweepDeadHosts() {
  std::erase_if(registrations_, [](const Registration& registration) { return !registration.host->isAlive(); });
  for (auto& [id, instance] : running_) {
    if (!instance.host->isAlive()) (void)endInstance(instance);
  }
  armTimer();
}

// Instances.

std::optional<JobManager::Launch> ProcessJobManager::beginLaunch(const std::shared_ptr<const PeerIdentity>& host,
                                                                 const std::string& executable, int* errorNumber) {
  const auto path = canonical(executable);
  return queue_.sync([&]() -> std::optional<Launch> {
    queue_.assertOnQueue();
    const auto place = std::find_if(registrations_.begin(), registrations_.end(), [&](const Registration& each) {
      return path && each.executable == *path && sameProcess(*each.host, *host);
    });
    const PlugInRecord record = place == registrations_.end() ? nullptr : currentRecord(*place);
    if (record == nullptr) {
      *errorNumber = EPERM;
      return std::nullopt;
    }
    const auto ofHost = std::count_if(running_.begin(), running_.end(),
                                      [&](const auto& entry) { return sameProcess(*entry.second.host, *host); });
    if (static_cast<std::size_t>(ofHost) >= kInstancesPerHost) {
      *errorNumber = EAGAIN;
      return std::nullopt;
    }
    const std::uint64_t id = nextId_++;
    Running& instance = running_[id];
    instance.host = place->host;
    instance.bundleIdentifier = place->bundleIdentifier;
    instance.version = place->version;
    return Launch{id,
                  place->executable,
                  place->bundle,
                  record->dataContainerURL ? record->dataContainerURL->path() : std::string(),
                  place->overlay.profile,
                  place->overlay.environment};
  });
}

int ProcessJobManager::instanceStarted(std::uint64_t id, UniqueFd pidfd) {
  const auto process = PeerIdentity::ofPidfd(pidfd.get());
  return queue_.sync([&] {
    queue_.assertOnQueue();
    const auto place = running_.find(id);
    if (place == running_.end() || place->second.ending || !place->second.host->isAlive()) return EPERM;
    Running& instance = place->second;
    instance.process = process;
    instance.watch = watch(process->pidfd(), [id](ProcessJobManager& self) {
      self.queue_.assertOnQueue();
      self.instanceEnded(id);
    });
    return 0;
  });
}

void ProcessJobManager::launchFailed(std::uint64_t id) {
  queue_.sync([&] {
    queue_.assertOnQueue();
    const auto place = running_.find(id);
    if (place != running_.end() && place->second.process == nullptr) instanceEnded(id);
  });
}

int ProcessJobManager::endInstance(Running& instance) {
  if (instance.ending) return 0;
  if (instance.process != nullptr) {
    const int failure = signalProcess(*instance.process, SIGTERM);
    if (failure != 0 && failure != ESRCH) return failure;
    instance.killAt = std::chrono::steady_clock::now() + grace_;
  }
  instance.ending = true;
  return 0;
}

void ProcessJobManager::instanceEnded(std::uint64_t id) {
  if (running_.erase(id) == 0) return;
  for (auto removal = removals_.begin(); removal != removals_.end();) {
    auto& waiting = removal->waitingFor;
    std::erase(waiting, id);
    if (!waiting.empty()) {
      ++removal;
      continue;
    }
    const SerialQueue& target = *removal->queue;
    target.async([queue = std::move(removal->queue), answer = std::move(removal->answer), result = removal->failure] {
      answer(result);
    });
    removal = removals_.erase(removal);
  }
}

void ProcessJobManager::graceOver() {
  std::uint64_t expirations = 0;
  (void)!read(timer_.get(), &expirations, sizeof expirations);
  const auto now = std::chrono::steady_clock::now();
  for (auto& [id, instance] : running_) {
    if (!instance.ending || instance.process == nullptr || instance.killed || instance.killAt > now) continue;
    instance.killed = true;
    (void)signalProcess(*instance.process, SIGKILL);
  }
  armTimer();
}

void ProcessJobManager::armTimer() {
  std::optional<std::chrono::steady_clock::time_point> earliest;
  for (const auto& [id, instance] : running_) {
    if (!instance.ending || instance.process == nullptr || instance.killed) continue;
    if (!earliest || instance.killAt < *earliest) earliest = instance.killAt;
  }
  itimerspec spec{};
  if (earliest) {
    // One nanosecond later, so that what is due is over by then.
    const auto due = std::chrono::nanoseconds(earliest->time_since_epoch()).count() + 1;
    spec.it_value = {due / 1'000'000'000, due % 1'000'000'000};
  }
  (void)timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME, &spec, nullptr);
}

std::vector<JobManager::Instance> ProcessJobManager::instances(const std::string& bundleIdentifier) {
  return queue_.sync([&] {
    queue_.assertOnQueue();
    std::vector<Instance> found;
    for (const auto& [id, instance] : running_) {
      if (instance.bundleIdentifier != bundleIdentifier || instance.process == nullptr) continue;
      found.push_back({instance.bundleIdentifier, instance.version, instance.process->pid(), instance.busyCount != 0});
    }
    return found;
  });
}

void ProcessJobManager::endAll() {
  queue_.sync([this] {
    queue_.assertOnQueue();
    for (auto& [id, instance] : running_) (void)endInstance(instance);
    armTimer();
  });
}

std::optional<std::uint64_t> ProcessJobManager::instanceOf(const PeerIdentity& process) {
  const auto wanted = foreignNamespace(process);
  if (!wanted) return std::nullopt;
  return queue_.sync([&]() -> std::optional<std::uint64_t> {
    queue_.assertOnQueue();
    for (const auto& [id, instance] : running_) {
      if (instance.process != nullptr && foreignNamespace(*instance.process) == wanted) return id;
    }
    return std::nullopt;
  });
}

void ProcessJobManager::setBusy(std::uint64_t id, bool busy) {
  queue_.sync([&] {
    queue_.assertOnQueue();
    const auto place = running_.find(id);
    if (place == running_.end()) return;
    std::size_t& count = place->second.busyCount;
    if (busy) {
      ++count;
    } else if (count != 0) {
      --count;
    }
  });
}

}  // namespace platform
