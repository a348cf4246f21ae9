// Registering and unregistering plug-ins by request.
//
// A plug-in of a watched folder is registered because it is there; unregistering it leaves a mark that lasts while the
// bundle is the same. Any other plug-in is registered because of a mark that lasts until it is unregistered, also while
// its bundle is away.
#include <algorithm>
#include <cerrno>

#include "platform/registry/BundleRegistry.h"
#include "platform/signing/CodeSigning.h"

namespace platform {
namespace {

Error refusal(const std::string& path, const std::string& reason) {
  return {"AppRegistry", EINVAL, path + ": " + reason};
}

}  // namespace

// The application X for X.app/PlugIns/Y, else the plug-in itself.
std::string BundleRegistry::rootOf(const std::string& plugIn) {
  const std::string folder = plugIn.substr(0, plugIn.rfind('/'));
  const std::string ending = std::string(kApplicationEnding) + "/" + kPlugInsFolder;
  return folder.ends_with(ending) ? folder.substr(0, folder.rfind('/')) : plugIn;
}

bool BundleRegistry::isOfFolder(RootKind kind) {
  return kind == RootKind::Application || kind == RootKind::PlugIn;
}

// The containing application's Info.plist says whose the plug-in is, so it must be as good as the plug-in's own files.
std::optional<Error> BundleRegistry::trustProblemOf(const std::string& plugIn, const std::string& root) {
  auto problem = bundleTrustProblem(plugIn);
  if (!problem && root != plugIn) problem = trustProblem(root + "/Info.plist");
  return problem;
}

std::optional<Error> BundleRegistry::registerPlugin(const std::string& path) {
  if (snapshot()->plugInAt(path) != nullptr) return std::nullopt;
  const auto resolved = options_.files->resolvePath(path);
  if (!resolved) return refusal(path, "there is no such bundle");
  if (*resolved != path) return registerPlugin(*resolved);
  const std::string root = rootOf(path);
  if (auto problem = trustProblemOf(path, root)) return problem;

  Changes changes;
  if (removed_.erase(path) != 0) changes.stored.removed[path] = std::nullopt;
  const bool inFolder = isOfFolder(kindOf(root));
  if (!inFolder) setAdded(path, true);
  lookAt(root, false, changes);
  const bool found = std::any_of(changes.installed.begin(), changes.installed.end(),
                                 [&](const RegistrationPtr& each) { return each->path == path; });
  if (!inFolder && found) changes.stored.added[path] = true;
  if (!inFolder && !found) setAdded(path, false);
  commit(std::move(changes));
  if (found) return std::nullopt;
  return refusal(path, "it is no plug-in bundle that can be read");
}

std::optional<Error> BundleRegistry::unregisterPlugin(const std::string& path) {
  const std::string root = rootOf(path);
  const auto added = added_.find(root);
  const bool isAdded = added != added_.end() && added->second.contains(path);
  const RegisteredGroupPtr group = snapshot()->groupAt(root);
  RegistrationPtr registration;
  if (group != nullptr) {
    for (const RegistrationPtr& each : group->registrations) {
      if (each->path == path) registration = each;
    }
  }
  if (registration == nullptr && !isAdded) return refusal(path, "there is no such plug-in");
  Changes changes;
  if (isAdded) {
    setAdded(path, false);
    changes.stored.added[path] = false;
  }
  if (registration != nullptr && isOfFolder(kindOf(root))) {
    removed_[path] = registration->stamp;
    changes.stored.removed[path] = registration->stamp;
  }
  lookAt(root, false, changes);
  commit(std::move(changes));
  return std::nullopt;
}

void BundleRegistry::setAdded(const std::string& path, bool added) {
  const std::string root = rootOf(path);
  if (added) {
    added_[root].insert(path);
  } else if (const auto place = added_.find(root); place != added_.end()) {
    place->second.erase(path);
    if (place->second.empty()) added_.erase(place);
  }
  if (watch_ == nullptr) return;
  watchFolders();
  if (!added_.contains(root)) watch_->forgetInside(root);
}

}  // namespace platform
