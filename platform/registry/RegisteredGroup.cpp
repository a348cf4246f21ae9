#include "platform/registry/RegisteredGroup.h"

#include <algorithm>

namespace platform {
namespace {

std::string versionText(const Value& version) {
  if (version.isBoolean()) return version.booleanValue() ? "1" : "0";
  return version.isString() || version.isNumber() ? version.describe() : std::string();
}

bool isBelow(const std::string& path, const std::string& folder) {
  return path.size() > folder.size() && path.starts_with(folder) && path[folder.size()] == '/';
}

ARApplicationProxy applicationRecord(const BundleRegistration& bundle, const RecordContext& context) {
  ARApplicationProxy record;
  record.bundleURL = Url::file(bundle.path);
  record.bundleIdentifier = bundle.bundleIdentifier();
  record.isPlaceholder = bundle.info["HBBundlePlaceholder"].booleanValue();
  record.localizedName = bundle.localizedName(context.languages);
  return record;
}

ARExtoraProxy plugInRecord(const BundleRegistration& bundle, const std::string& container,
                           const RecordContext& context) {
  ARExtoraProxy record;
  record.plugInUUID = bundle.uuid;
  record.plugInIdentifier = bundle.identifier();
  record.bundleIdentifier = bundle.bundleIdentifier();
  record.originalIdentifier = record.bundleIdentifier.empty() ? record.plugInIdentifier : record.bundleIdentifier;
  record.bundleURL = Url::file(bundle.path);
  record.bundleVersion = versionText(bundle.info["HBBundleVersion"]);
  record.plugInDictionary = bundle.plugInDictionary();
  record.infoDictionary = bundle.info;
  record.entitlements = bundle.entitlements;
  record.registrationDate = bundle.date;
  record.onSystemPartition = std::any_of(context.systemFolders.begin(), context.systemFolders.end(),
                                         [&](const std::string& folder) { return isBelow(bundle.path, folder); });
  if (!container.empty()) record.dataContainerURL = Url::file(container);
  record.localizedName = bundle.localizedName(context.languages);
  record.localizedShortName = bundle.localizedShortName(context.languages);
  return record;
}

}  // namespace

RegisteredGroupPtr RegisteredGroup::make(RegistrationPtr application, std::vector<RegistrationPtr> registrations,
                                         std::vector<std::string> containers, const RecordContext& context) {
  auto group = std::make_shared<RegisteredGroup>();
  if (application) group->application = applicationRecord(*application, context);
  for (std::size_t i = 0; i < registrations.size(); ++i) {
    ARExtoraProxy& record = group->plugIns.emplace_back(plugInRecord(*registrations[i], containers[i], context));
    if (!group->application) continue;
    record.containingApplication = &*group->application;
    group->application->plugIns.push_back(&record);
  }
  group->applicationRegistration = std::move(application);
  group->registrations = std::move(registrations);
  group->containers = std::move(containers);
  return group;
}

}  // namespace platform
