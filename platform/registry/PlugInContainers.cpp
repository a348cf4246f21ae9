#include "platform/registry/PlugInContainers.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <charconv>
#include <utility>
#include <variant>

#include "platform/registry/RegistryLog.h"

namespace platform {
namespace {

unsigned numberOf(const std::string& name) {
  unsigned number = 1;
  const std::size_t at = name.find('@');
  if (at != std::string::npos) std::from_chars(name.data() + at + 1, name.data() + name.size(), number);
  return number;
}

bool exists(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0;
}

}  // namespace

PlugInContainers::PlugInContainers(std::shared_ptr<Containers> containers, std::string folder,
                                   const std::vector<ContainerOwner>& owners)
    : containers_(std::move(containers)), folder_(std::move(folder)) {
  for (const ContainerOwner& owner : owners) owners_[owner.identifier].push_back(owner);
  for (auto& [identifier, all] : owners_) {
    std::sort(all.begin(), all.end(),
              [](const ContainerOwner& a, const ContainerOwner& b) { return numberOf(a.name) < numberOf(b.name); });
  }
}

std::string PlugInContainers::nameFor(const std::string& identifier, const std::string& applicationIdentifier,
                                      const std::string& applicationPath) {
  std::vector<ContainerOwner>& all = owners_[identifier];
  for (const ContainerOwner& owner : all) {
    if (owner.applicationIdentifier == applicationIdentifier && owner.applicationPath == applicationPath) {
      return owner.name;
    }
  }
  for (ContainerOwner& owner : all) {
    if (applicationIdentifier.empty() || owner.applicationIdentifier != applicationIdentifier ||
        exists(owner.applicationPath)) {
      continue;
    }
    owner.applicationPath = applicationPath;
    changed_.push_back(owner);
    return owner.name;
  }
  const unsigned number = all.empty() ? 1 : numberOf(all.back().name) + 1;
  const std::string name = number == 1 ? identifier : fmt::format("{}@{}", identifier, number);
  all.push_back({name, identifier, applicationIdentifier, applicationPath});
  changed_.push_back(all.back());
  return name;
}

// Asking the service costs a dozen system calls, which thousands of plug-ins need not pay at every start.
bool PlugInContainers::isFittedOut(const std::string& name) const {
  const auto look = [&](const std::string& path, struct stat& status) {
    return ::fstatat(opened_.get(), path.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
  };
  struct stat status {};
  return right_ && look(name, status) && status.st_uid == right_->user && status.st_mode == right_->mode &&
         look(name + "/tmp", status);
}

std::string PlugInContainers::containerFor(const BundleRegistration& plugIn, const BundleRegistration* application) {
  const std::string identifier = plugIn.identifier();
  if (plugIn.isDataOnly() || !isPlugInContainerName(identifier)) return {};
  const std::string name = nameFor(identifier, application == nullptr ? "" : application->bundleIdentifier(),
                                   application == nullptr ? "" : application->path);
  if (isFittedOut(name)) return folder_ + "/" + name;
  const auto made = containers_->containerCreateOrLookup(kPlugInContainerClass, name, 0);
  const auto* path = std::get_if<std::string>(&made);
  if (path == nullptr) {
    const auto number = static_cast<int>(std::get<std::uint64_t>(made));
    registryLog().error("no data container {} for the plug-in at {}: {}", name, plugIn.path,
                        posixError(number, "the container service"));
    return {};
  }
  if (!opened_) opened_.reset(::open(folder_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  struct stat status {};
  if (::lstat(path->c_str(), &status) == 0) right_ = {status.st_uid, status.st_mode};
  return *path;
}

std::vector<ContainerOwner> PlugInContainers::takeChangedOwners() {
  return std::exchange(changed_, {});
}

}  // namespace platform
