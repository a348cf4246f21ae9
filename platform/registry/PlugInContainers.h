// PlugInContainers: which data container a plug-in has.
//
// The container of an identifier belongs to the application whose plug-in got it first; a plug-in of the same
// identifier in another application gets <identifier>@2, and so on. An application is known by its bundle identifier
// and its path: it keeps its containers when it moves (nothing is left at the old path) and nobody gets them by taking
// its name. Ownership is kept in the registry store and outlives the plug-ins. Used on one queue.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/container/Containers.h"
#include "platform/files/UniqueFd.h"
#include "platform/registry/BundleRegistration.h"
#include "platform/registry/RegistryStore.h"

namespace platform {

class PlugInContainers {
 public:
  /// `folder` is where `containers` keeps them; `owners` come from the store.
  PlugInContainers(std::shared_ptr<Containers> containers, std::string folder,
                   const std::vector<ContainerOwner>& owners);

  /// The path of the plug-in's container, made when missing. Empty for a data-only plug-in, for an identifier that
  /// cannot be a part of a path or is the daemon's own, and (logged) when the container cannot be made. `application`
  /// is null for a plug-in in none.
  std::string containerFor(const BundleRegistration& plugIn, const BundleRegistration* application);

  /// The owners that are new or have moved since this was asked last.
  std::vector<ContainerOwner> takeChangedOwners();

 private:
  std::string nameFor(const std::string& identifier, const std::string& applicationIdentifier,
                      const std::string& applicationPath);
  bool isFittedOut(const std::string& name) const;

  const std::shared_ptr<Containers> containers_;
  const std::string folder_;
  UniqueFd opened_;  // the folder; empty until the first container has been made
  std::unordered_map<std::string, std::vector<ContainerOwner>> owners_;  // by plug-in identifier, by number
  std::vector<ContainerOwner> changed_;
  // User and mode of a container that the service has just set right; nothing before that.
  struct Right {
    unsigned user = 0;
    unsigned mode = 0;
  };
  std::optional<Right> right_;
};

}  // namespace platform
