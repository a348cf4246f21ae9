// Records: what the application registry knows about one installed plug-in or application. Immutable.
//
// An application and its plug-ins live in one InstalledGroup; the shared pointers that the registry hands out point
// into it and keep all of it alive, so that the plain pointers between its members stay valid as long as one record is
// held.
#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/value/Url.h"
#include "platform/value/Uuid.h"
#include "platform/value/Value.h"

namespace platform {

struct ARExtoraProxy;

/// The record of an application.
struct ARApplicationProxy {
  std::optional<Url> bundleURL;
  std::string bundleIdentifier;
  bool isPlaceholder = false;
  std::string localizedName;
  std::vector<const ARExtoraProxy*> plugIns;  ///< in the registry's order (by bundle path)
  std::string describe() const { return bundleIdentifier + " at " + (bundleURL ? bundleURL->path() : "?"); }
};

/// The record of a plug-in.
struct ARExtoraProxy {
  std::optional<Uuid> plugInUUID;
  std::string plugInIdentifier;    ///< empty: it has none
  std::string originalIdentifier;  ///< empty: it has none
  std::optional<Url> bundleURL;
  std::string bundleIdentifier;  ///< HBBundleIdentifier of its Info.plist; empty: it has none
  std::string bundleVersion;     ///< HBBundleVersion as text; empty: it has none
  Value plugInDictionary;        ///< "HXExtension" (or "Extora") of its Info.plist
  Value infoDictionary;          ///< its whole Info.plist; nothing when it cannot be had
  Value entitlements;            ///< a dictionary, or nothing
  double registrationDate = 0;   ///< seconds since 1970-01-01T00:00:00Z
  bool onSystemPartition = false;
  std::optional<Url> dataContainerURL;
  std::string localizedName;
  std::string localizedShortName;
  const ARApplicationProxy* containingApplication = nullptr;  ///< null: it is in no application
  std::string describe() const {
    return plugInIdentifier + " at " + (bundleURL ? bundleURL->path() : std::string("?"));
  }
};

using PlugInRecord = std::shared_ptr<const ARExtoraProxy>;
using ApplicationRecord = std::shared_ptr<const ARApplicationProxy>;
using PlugInRecords = std::vector<PlugInRecord>;

/// What is made, published and dropped together. Addresses of its members do not change.
struct InstalledGroup {
  std::optional<ARApplicationProxy> application;
  std::deque<ARExtoraProxy> plugIns;
};

/// A record of `group` that keeps the whole group alive.
inline PlugInRecord plugInRecord(const std::shared_ptr<const InstalledGroup>& group, std::size_t index) {
  return {group, &group->plugIns[index]};
}
/// The record of the plug-in `index` of an application that is itself held through `application`.
inline PlugInRecord plugInRecordOf(const ApplicationRecord& application, std::size_t index) {
  return {application, application->plugIns[index]};
}
/// The containing application of a record that is held; null when there is none.
inline ApplicationRecord containingApplicationOf(const PlugInRecord& record) {
  return record->containingApplication == nullptr ? nullptr : ApplicationRecord(record, record->containingApplication);
}

}  // namespace platform
