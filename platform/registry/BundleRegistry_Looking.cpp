// Looking at bundles and making the next snapshot of what was found.
#include <algorithm>
#include <iterator>
#include <string_view>
#include <unordered_set>

#include "platform/registry/BundleRegistry.h"
#include "platform/registry/RegistryLog.h"

namespace platform {
namespace {

// The folder of `root`.
std::string folderOf(const std::string& root) {
  return root.substr(0, root.rfind('/'));
}

using Pointers = std::unordered_set<const BundleRegistration*>;

Pointers pointersTo(const std::vector<RegistrationPtr>& registrations) {
  Pointers pointers;
  for (const RegistrationPtr& each : registrations) pointers.insert(each.get());
  return pointers;
}

}  // namespace

BundleRegistry::RootKind BundleRegistry::kindOf(const std::string& root) const {
  const std::string folder = folderOf(root);
  if (root.ends_with(kApplicationEnding) &&
      std::find(applicationFolders_.begin(), applicationFolders_.end(), folder) != applicationFolders_.end()) {
    return RootKind::Application;
  }
  if (folder == plugInFolder_ && !folder.empty()) return RootKind::PlugIn;
  const auto added = added_.find(root);
  if (added == added_.end()) return RootKind::None;
  return added->second.contains(root) ? RootKind::AddedPlugIn : RootKind::AddedApplication;
}

void BundleRegistry::firstScan(StoredRegistry stored) {
  queue_.assertOnQueue();
  registrations_ = std::move(stored.registrations);
  removed_ = std::move(stored.removed);
  for (const std::string& path : stored.added) added_[rootOf(path)].insert(path);
  // Watched before it is looked at: what changes in between is noticed.
  if (watch_ != nullptr) watchFolders();

  Changes changes;
  for (const auto& [root, left] : everywhere()) lookAt(root, left, changes);
  std::unordered_set<std::string_view> kept;
  for (const Prepared& group : changes.groups) {
    if (group.application != nullptr) kept.insert(group.application->path);
    for (const RegistrationPtr& each : group.plugIns) kept.insert(each->path);
  }
  for (const auto& [path, registration] : registrations_) {
    if (!kept.contains(path)) changes.stored.gone.push_back(path);
  }
  (void)apply(changes);  // nobody listens yet
  pollIfNeeded();
}

BundleRegistry::Roots BundleRegistry::everywhere() {
  Roots roots;
  std::vector<ScanProblem> problems;
  const auto list = [&](const std::string& folder, BundleScanner::FolderKind kind) {
    for (std::string& root : BundleScanner::rootsIn(folder, kind, problems)) roots.emplace(std::move(root), false);
  };
  for (const std::string& folder : applicationFolders_) list(folder, BundleScanner::FolderKind::Applications);
  list(plugInFolder_, BundleScanner::FolderKind::PlugIns);
  for (const auto& [root, paths] : added_) roots.emplace(root, false);
  for (const RegisteredGroupPtr& group : snapshot()->groups()) roots.emplace(group->root(), false);
  report(problems);
  return roots;
}

void BundleRegistry::look(const Roots& roots) {
  Changes changes;
  for (const auto& [root, left] : roots) lookAt(root, left, changes);
  commit(std::move(changes));
  pollIfNeeded();
}

ScannedGroup BundleRegistry::scan(const std::string& root, RootKind kind, bool left) {
  const BundleScanner::Known known = [&](const std::string& path) -> RegistrationPtr {
    queue_.assertOnQueue();
    const auto place = registrations_.find(path);
    return left || place == registrations_.end() ? nullptr : place->second;
  };
  switch (kind) {
    case RootKind::Application:
      return BundleScanner::scanApplication(root, known);
    case RootKind::PlugIn:
      return BundleScanner::scanPlugIn(root, known);
    case RootKind::AddedApplication:
    case RootKind::AddedPlugIn: {
      // Only the rule of trust lets these in, so it is asked again each time.
      std::set<std::string> trusted;
      std::vector<ScanProblem> problems;
      for (const std::string& path : added_.at(root)) {
        if (const auto problem = trustProblemOf(path, root)) {
          problems.push_back({path, problem->describe(), {}});
        } else {
          trusted.insert(path);
        }
      }
      ScannedGroup found;
      if (!trusted.empty()) {
        found = kind == RootKind::AddedPlugIn ? BundleScanner::scanPlugIn(root, known)
                                              : BundleScanner::scanApplication(root, known, &trusted);
      }
      found.found = found.found && !found.plugIns.empty();
      found.problems.insert(found.problems.end(), problems.begin(), problems.end());
      return found;
    }
    case RootKind::None:
      break;
  }
  return {};
}

// Scans `root`, and watches its inside while it is not as it should be or may not be finished.
ScannedGroup BundleRegistry::scanWatched(const std::string& root, RootKind kind, bool left) {
  if (watch_ == nullptr || kind == RootKind::None) return scan(root, kind, left);
  constexpr std::size_t kMostYoung = 64;
  constexpr auto kGrownUp = std::chrono::seconds(11);
  const bool watched = watch_->watchesInside(root);
  if (watched) watch_->watchInside(root, BundleScanner::directoriesInside(root));
  ScannedGroup found = scan(root, kind, left);
  const bool added = kind == RootKind::AddedApplication || kind == RootKind::AddedPlugIn;
  const bool unfinished = !found.problems.empty() || !found.found || added;
  if (!unfinished && !found.young) {
    watch_->forgetInside(root);
    return found;
  }
  if (found.young && !due_.contains(root)) lookAgainAt(root, kGrownUp);
  if (watched || (!unfinished && watch_->insideCount() >= kMostYoung)) return found;
  watch_->watchInside(root, BundleScanner::directoriesInside(root));
  // What changed before the watches were there is seen now.
  return scan(root, kind, left);
}

// A plug-in that was unregistered by request stays so until it is another: changed, or away meanwhile.
void BundleRegistry::leaveOutRemoved(ScannedGroup& found, bool left, StoreChange& stored) {
  if (removed_.empty()) return;
  std::erase_if(found.plugIns, [&](const RegistrationPtr& plugIn) {
    queue_.assertOnQueue();
    const auto mark = removed_.find(plugIn->path);
    if (mark == removed_.end()) return false;
    if (!left && mark->second == plugIn->stamp) return true;
    removed_.erase(mark);
    stored.removed[plugIn->path] = std::nullopt;
    return false;
  });
}

void BundleRegistry::lookAt(const std::string& root, bool left, Changes& changes) {
  const RegisteredGroupPtr before = snapshot()->groupAt(root);
  const RootKind kind = kindOf(root);
  if (kind == RootKind::None && before == nullptr) return;
  ScannedGroup found = scanWatched(root, kind, left);
  if (found.problems.empty()) forgetReports(root);
  report(found.problems);
  leaveOutRemoved(found, left, changes.stored);
  const bool registered = found.found && (found.application != nullptr || !found.plugIns.empty());
  if (before == nullptr && !registered) return;
  if (before != nullptr && registered && before->applicationRegistration == found.application &&
      before->registrations == found.plugIns) {
    return;
  }

  // What the group had and has no more, and the other way round.
  const Pointers now = registered ? pointersTo(found.plugIns) : Pointers();
  const Pointers then = before != nullptr ? pointersTo(before->registrations) : Pointers();
  if (before != nullptr) {
    for (std::size_t i = 0; i < before->registrations.size(); ++i) {
      if (now.contains(before->registrations[i].get())) continue;
      changes.stored.gone.push_back(before->registrations[i]->path);
      changes.uninstalled.push_back(plugInRecord(before, i));
    }
    if (before->applicationRegistration != nullptr && !registered) changes.stored.gone.push_back(root);
  }
  if (!registered) {
    changes.gone.push_back(root);
    return;
  }
  const auto keep = [&](const RegistrationPtr& registration) {
    queue_.assertOnQueue();
    const auto place = registrations_.find(registration->path);
    if (place == registrations_.end() || place->second != registration) {
      changes.stored.registrations.push_back(registration);
    }
  };
  if (found.application != nullptr) keep(found.application);
  Prepared group{found.application, {}, {}};
  for (const RegistrationPtr& plugIn : found.plugIns) {
    keep(plugIn);
    if (!then.contains(plugIn.get())) changes.installed.insert(plugIn);
    group.containers.push_back(containers_->containerFor(*plugIn, found.application.get()));
  }
  group.plugIns = std::move(found.plugIns);
  changes.groups.push_back(std::move(group));
}

void BundleRegistry::commit(Changes changes) {
  const PlugInRecords installed = apply(changes);
  if (changes.empty()) return;
  tellObservers(changes.uninstalled, installed);
  postChange();
}

PlugInRecords BundleRegistry::apply(Changes& changes) {
  changes.stored.containers = containers_->takeChangedOwners();
  (void)store_->write(changes.stored);  // it has logged what went wrong; the registry goes on without a memory of it
  for (const std::string& path : changes.stored.gone) registrations_.erase(path);
  for (const RegistrationPtr& each : changes.stored.registrations) registrations_[each->path] = each;
  PlugInRecords installed;
  if (changes.empty()) return installed;

  const MutexLock lock(publishing_);
  std::vector<RegisteredGroupPtr> groups;
  for (const Prepared& each : changes.groups) {
    groups.push_back(RegisteredGroup::make(each.application, each.plugIns, each.containers, context_));
    const RegisteredGroupPtr& group = groups.back();
    for (std::size_t i = 0; i < group->registrations.size(); ++i) {
      if (changes.installed.contains(group->registrations[i])) installed.push_back(plugInRecord(group, i));
    }
  }
  publish(snapshot()->changed(std::move(groups), changes.gone));
  return installed;
}

void BundleRegistry::publish(const SnapshotPtr& next) {
  SnapshotPtr before = next;  // destroyed without the lock when nobody else holds it
  {
    const MutexLock lock(published_);
    snapshot_.swap(before);
    languages_ = context_.languages;
  }
  knowledge_.set(next->knowledge());
}

void BundleRegistry::followLocale() {
  {
    const MutexLock lock(publishing_);
    context_.languages = localizationCandidates(options_.locale->current());
    const SnapshotPtr now = snapshot();
    std::vector<RegisteredGroupPtr> groups;
    for (const RegisteredGroupPtr& group : now->groups()) {
      const auto isLocalized = [](const RegistrationPtr& each) { return each != nullptr && !each->names.empty(); };
      if (isLocalized(group->applicationRegistration) ||
          std::any_of(group->registrations.begin(), group->registrations.end(), isLocalized)) {
        groups.push_back(group->relocalized(context_));
      }
    }
    publish(now->changed(std::move(groups), {}));
  }
  queue_.async([this] {
    queue_.assertOnQueue();
    postChange();
  });
}

void BundleRegistry::tellObservers(const PlugInRecords& uninstalled, const PlugInRecords& installed) {
  std::vector<std::shared_ptr<RegistryObserver>> observers;
  {
    const MutexLock lock(observersMutex_);
    std::erase_if(observers_, [](const auto& each) { return each.expired(); });
    for (const auto& each : observers_) {
      if (auto observer = each.lock()) observers.push_back(std::move(observer));
    }
  }
  for (const auto& observer : observers) {
    if (!uninstalled.empty()) observer->pluginsWillUninstall(uninstalled);
    if (!installed.empty()) observer->pluginsDidInstall(installed);
  }
}

void BundleRegistry::postChange() {
  if (options_.notifications != nullptr) options_.notifications->postNotification(kRegistryChangeNotification);
}

void BundleRegistry::report(const std::vector<ScanProblem>& problems) {
  for (const ScanProblem& problem : problems) {
    auto now = std::make_pair(problem.reason, problem.stamp);
    auto& last = reported_[problem.path];
    if (last == now) continue;
    last = std::move(now);
    if (problem.kind == ScanProblem::Kind::Entitlements) {
      registryLog().error("the entitlements of {} do not count: {}", problem.path, problem.reason);
    } else {
      registryLog().def("left out {}: {}", problem.path, problem.reason);
    }
  }
}

void BundleRegistry::forgetReports(const std::string& root) {
  auto next = reported_.lower_bound(root);
  while (next != reported_.end() && next->first.starts_with(root)) {
    const bool below = next->first.size() == root.size() || next->first[root.size()] == '/';
    next = below ? reported_.erase(next) : std::next(next);
  }
}

}  // namespace platform
