// RegistrySnapshot: everything that the registry knows at one time. Immutable; a reader holds it through a shared
// pointer and never waits for a change. Snapshots share what did not change between them. Safe for use by any thread.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/registry/QueryIndex.h"
#include "platform/registry/RegisteredGroup.h"
#include "platform/registry/TypeRegistry.h"

namespace platform {

class RegistrySnapshot {
 public:
  /// An empty one.
  RegistrySnapshot();
  RegistrySnapshot(const RegistrySnapshot&) = delete;
  RegistrySnapshot& operator=(const RegistrySnapshot&) = delete;

  /// This snapshot with `groups` instead of those of the same roots, and without the roots `gone`; with a fresh
  /// knowledge UUID. Costs a copy of the tables, not of what they point to.
  std::shared_ptr<const RegistrySnapshot> changed(std::vector<RegisteredGroupPtr> groups,
                                                  const std::vector<std::string>& gone) const;

  const Uuid& knowledge() const { return knowledge_; }
  /// Ordered by root.
  const std::vector<RegisteredGroupPtr>& groups() const { return groups_; }
  /// Ordered by bundle path.
  const PlugInRecords& plugIns() const { return plugIns_; }
  /// The plug-ins that may satisfy `query`, in that order; those of all when nothing in it narrows.
  PlugInRecords candidates(const Value& query) const;

  // Look-ups; null or nothing when there is none.
  RegisteredGroupPtr groupAt(const std::string& root) const;
  PlugInRecord plugInByUUID(const Uuid& uuid) const;
  PlugInRecord plugInAt(const std::string& path) const;
  ApplicationRecord applicationAt(const std::string& path) const;

  const TypeRegistry& types() const { return declarations_->types; }
  /// The SDK dictionary that an application declares for the extension point; of several the first by path.
  const Value& extensionPoint(const std::string& identifier) const;

 private:
  struct Declarations {
    TypeRegistry types;
    std::map<std::string, Value> extensionPoints;
  };
  static std::shared_ptr<const Declarations> declarationsOf(const std::vector<RegisteredGroupPtr>& groups);

  // Constant after construction.
  Uuid knowledge_;
  std::vector<RegisteredGroupPtr> groups_;
  PlugInRecords plugIns_;
  std::vector<std::pair<Uuid, PlugInRecord>> byUUID_;  // ordered by UUID
  std::shared_ptr<const Declarations> declarations_;
  QueryIndex index_;  // over plugIns_
};

using SnapshotPtr = std::shared_ptr<const RegistrySnapshot>;

}  // namespace platform
