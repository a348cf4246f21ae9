#include "tests/support/FakeRegistry.h"

#include <fmt/format.h>

#include <algorithm>

namespace tests {

using platform::ARApplicationProxy;
using platform::ARExtoraProxy;
using platform::Dictionary;
using platform::InstalledGroup;
using platform::PlugInRecord;
using platform::PlugInRecords;
using platform::Url;
using platform::Uuid;
using platform::Value;

ARExtoraProxy sampleRecord(const std::string& identifier, const Dictionary& attributes, const Value& entitlements) {
  ARExtoraProxy record;
  record.plugInUUID = Uuid::random();
  record.plugInIdentifier = identifier;
  record.originalIdentifier = identifier + ".original";
  record.bundleURL = Url::file(fmt::format("/Apps/{0}.app/PlugIns/{0}.appex", identifier));
  record.bundleIdentifier = identifier;
  record.bundleVersion = "7.1";
  record.plugInDictionary = Dictionary{{"HXExtensionAttributes", attributes}};
  record.infoDictionary = Dictionary{{"HXExtension", record.plugInDictionary}};
  record.entitlements = entitlements;
  record.registrationDate = 1'000'000'000.75;
  record.dataContainerURL = Url::file(fmt::format("/Containers/{}", identifier));
  record.localizedName = identifier + " name";
  record.localizedShortName = identifier + " short";
  return record;
}

PlugInRecord FakeRegistry::install(ARExtoraProxy plugIn) {
  ARApplicationProxy application;
  application.bundleURL = Url::file(fmt::format("/Apps/{}.app", plugIn.plugInIdentifier));
  application.bundleIdentifier = plugIn.plugInIdentifier + ".app";
  application.localizedName = plugIn.plugInIdentifier + " app";
  return platform::plugInRecord(install(std::move(application), {std::move(plugIn)}), 0);
}

std::shared_ptr<const InstalledGroup> FakeRegistry::install(std::optional<ARApplicationProxy> application,
                                                            std::vector<ARExtoraProxy> plugIns) {
  auto group = std::make_shared<InstalledGroup>();
  group->application = std::move(application);
  for (ARExtoraProxy& plugIn : plugIns) {
    group->plugIns.push_back(std::move(plugIn));
    if (!group->application) continue;
    group->plugIns.back().containingApplication = &*group->application;
    group->application->plugIns.push_back(&group->plugIns.back());
  }
  groups_.push_back(group);
  knowledge = Uuid::random();
  return group;
}

void FakeRegistry::uninstall(const Uuid& plugIn, bool tellObservers) {
  const auto holds = [&](const auto& group) {
    return std::any_of(group->plugIns.begin(), group->plugIns.end(),
                       [&](const ARExtoraProxy& record) { return record.plugInUUID == plugIn; });
  };
  const auto place = std::find_if(groups_.begin(), groups_.end(), holds);
  if (place == groups_.end()) return;
  const std::shared_ptr<const InstalledGroup> group = *place;
  groups_.erase(place);
  knowledge = Uuid::random();
  if (!tellObservers) return;
  PlugInRecords gone;
  for (std::size_t i = 0; i < group->plugIns.size(); ++i) gone.push_back(platform::plugInRecord(group, i));
  for (const auto& weak : observers_) {
    if (const auto observer = weak.lock()) observer->pluginsWillUninstall(gone);
  }
}

PlugInRecords FakeRegistry::registryInstalledPlugIns() {
  PlugInRecords all;
  for (const auto& group : groups_) {
    for (std::size_t i = 0; i < group->plugIns.size(); ++i) all.push_back(platform::plugInRecord(group, i));
  }
  return all;
}

std::optional<PlugInRecords> FakeRegistry::registryPlugInsMatching(const Value&, const Filter& filter) {
  PlugInRecords found = registryInstalledPlugIns();
  std::erase_if(found,
                [&](const PlugInRecord& record) { return !filter(record->plugInIdentifier, record->entitlements); });
  return found;
}

PlugInRecord FakeRegistry::registryPlugInByUUID(const Uuid& uuid) {
  for (const PlugInRecord& record : registryInstalledPlugIns()) {
    if (record->plugInUUID == uuid) return record;
  }
  return nullptr;
}

PlugInRecord FakeRegistry::registryPlugInByURL(const Url& url) {
  for (const PlugInRecord& record : registryInstalledPlugIns()) {
    if (record->bundleURL == url) return record;
  }
  return nullptr;
}

platform::ApplicationRecord FakeRegistry::registryAppByBundleURL(const Url& url) {
  for (const auto& group : groups_) {
    if (group->application && group->application->bundleURL == url) return {group, &*group->application};
  }
  return nullptr;
}

void FakeRegistry::registryAddObserver(std::weak_ptr<platform::RegistryObserver> observer) {
  observers_.push_back(std::move(observer));
}

bool FakeRegistry::typeConformsTo(const std::string& type, const std::string& other) {
  return type == other || conformances.count({type, other}) != 0;
}

bool FakeRegistry::evaluateActivationRule(const Value& rule, const Value& items) {
  return rule == items["accepted"];
}

}  // namespace tests
