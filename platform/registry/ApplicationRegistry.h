// ApplicationRegistry: every installed application and the plug-ins inside it.
//
// What it knows is one immutable snapshot with a knowledge UUID that changes whenever the data changes; a reader takes
// a reference and never waits for a change in the making. Callable from any thread. Observers are called on a queue of
// the registry, uninstall before install.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/registry/Records.h"
#include "platform/value/Error.h"

namespace platform {

/// Told of installs and uninstalls.
class RegistryObserver {
 public:
  virtual ~RegistryObserver() = default;
  virtual void pluginsDidInstall(const PlugInRecords& records) = 0;
  virtual void pluginsWillUninstall(const PlugInRecords& records) = 0;
};

class ApplicationRegistry {
 public:
  /// Asked once per candidate with its identifier and its entitlements (a dictionary, or nothing).
  using Filter = std::function<bool(const std::string& identifier, const Value& entitlements)>;

  virtual ~ApplicationRegistry() = default;

  /// Every installed plug-in, in the registry's order.
  virtual PlugInRecords registryInstalledPlugIns() = 0;
  /// The plug-ins that may satisfy `query` (a rules dictionary; it may only narrow: a record that the rules would
  /// accept is never left out) and for which `filter` answered true; nothing when the registry cannot answer.
  virtual std::optional<PlugInRecords> registryPlugInsMatching(const Value& query, const Filter& filter) = 0;
  /// Null when there is none.
  virtual PlugInRecord registryPlugInByUUID(const Uuid& uuid) = 0;
  virtual PlugInRecord registryPlugInByURL(const Url& url) = 0;
  virtual ApplicationRecord registryAppByBundleURL(const Url& url) = 0;
  /// Drops in-process caches, so that later look-ups read again.
  virtual void registryClearSchemaCaches() = 0;
  /// Held weakly.
  virtual void registryAddObserver(std::weak_ptr<RegistryObserver> observer) = 0;
  /// The current knowledge UUID; nothing when the registry reports none.
  virtual std::optional<Uuid> registryKnowledgeUUID() = 0;
  /// key -> localized string of the strings table `table` of the record's bundle in the current locale; a key that
  /// cannot be localized is missing.
  virtual Dictionary registryLocalizedValues(const PlugInRecord& record, const std::vector<std::string>& keys,
                                             const std::string& table) = 0;
  /// The SDK dictionary of an extension point, or nothing.
  virtual Value registryExtensionPointSDK(const std::string& identifier) = 0;
  /// Registers the plug-in bundle at `url`; nothing on success. The new snapshot is published before this returns.
  [[nodiscard]] virtual std::optional<Error> registryRegisterPlugin(const Url& url) = 0;
  [[nodiscard]] virtual std::optional<Error> registryUnregisterPlugin(const Url& url) = 0;
  /// True when `type` is `other` or is declared, directly or through its ancestors, to conform to it.
  virtual bool typeConformsTo(const std::string& type, const std::string& other) = 0;
  /// Whether an activation rule accepts the items {"items": [{"types": [identifier, ...]}, ...]}.
  virtual bool evaluateActivationRule(const Value& rule, const Value& items) = 0;
};

}  // namespace platform
