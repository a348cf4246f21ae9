// FakeRegistry: an application registry of records that a test hands it. Changed by one thread at a time.
// sampleRecord gives a plug-in that passes the self-check, to be changed before it is installed.
#pragma once

#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/registry/ApplicationRegistry.h"

namespace tests {

/// A plug-in at /Apps/<identifier>.app/PlugIns/<identifier>.appex with a data container. `attributes` and
/// `entitlements` are its own.
platform::ARExtoraProxy sampleRecord(const std::string& identifier, const platform::Dictionary& attributes = {},
                                     const platform::Value& entitlements = {});

class FakeRegistry : public platform::ApplicationRegistry {
 public:
  /// Installs one plug-in in an application of its own at /Apps/<identifier>.app, or several in `application` (or
  /// none).
  platform::PlugInRecord install(platform::ARExtoraProxy plugIn);
  std::shared_ptr<const platform::InstalledGroup> install(std::optional<platform::ARApplicationProxy> application,
                                                          std::vector<platform::ARExtoraProxy> plugIns);
  /// Forgets a plug-in together with its application and all of its plug-ins, and tells the observers if asked to.
  void uninstall(const platform::Uuid& plugIn, bool tellObservers);

  platform::PlugInRecords registryInstalledPlugIns() override;
  std::optional<platform::PlugInRecords> registryPlugInsMatching(const platform::Value& query,
                                                                 const Filter& filter) override;
  platform::PlugInRecord registryPlugInByUUID(const platform::Uuid& uuid) override;
  platform::PlugInRecord registryPlugInByURL(const platform::Url& url) override;
  platform::ApplicationRecord registryAppByBundleURL(const platform::Url& url) override;
  void registryClearSchemaCaches() override { ++clears; }
  void registryAddObserver(std::weak_ptr<platform::RegistryObserver> observer) override;
  std::optional<platform::Uuid> registryKnowledgeUUID() override { return knowledge; }
  platform::Dictionary registryLocalizedValues(const platform::PlugInRecord&, const std::vector<std::string>&,
                                               const std::string&) override {
    return {};
  }
  platform::Value registryExtensionPointSDK(const std::string&) override { return {}; }
  std::optional<platform::Error> registryRegisterPlugin(const platform::Url&) override { return std::nullopt; }
  std::optional<platform::Error> registryUnregisterPlugin(const platform::Url&) override { return std::nullopt; }
  bool typeConformsTo(const std::string& type, const std::string& other) override;
  bool evaluateActivationRule(const platform::Value& rule, const platform::Value& items) override;

  std::optional<platform::Uuid> knowledge = platform::Uuid::random();
  /// (type, what it conforms to).
  std::set<std::pair<std::string, std::string>> conformances;
  int clears = 0;  ///< of the schema caches

 private:
  std::vector<std::shared_ptr<const platform::InstalledGroup>> groups_;
  std::vector<std::weak_ptr<platform::RegistryObserver>> observers_;
};

}  // namespace tests
