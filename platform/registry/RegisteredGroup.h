// RegisteredGroup: one application with its plug-ins, or one plug-in outside applications, as the registry publishes
// it: the registrations and the records made of them for one locale. Immutable; shared between snapshots.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/registry/BundleRegistration.h"
#include "platform/registry/Records.h"

namespace platform {

/// What records depend on besides their registration.
struct RecordContext {
  std::vector<std::string> languages;      ///< of the current locale, best first
  std::vector<std::string> systemFolders;  ///< canonical; what lies below them is on the system volume
};

struct RegisteredGroup : InstalledGroup {
  RegistrationPtr applicationRegistration;     ///< null when there is no application
  std::vector<RegistrationPtr> registrations;  ///< of the plug-ins, in the order of the records
  std::vector<std::string> containers;         ///< their data containers; empty: none

  /// `registrations` is ordered by path, `containers` goes with it. There is an application or exactly one plug-in.
  static std::shared_ptr<const RegisteredGroup> make(RegistrationPtr application,
                                                     std::vector<RegistrationPtr> registrations,
                                                     std::vector<std::string> containers, const RecordContext& context);
  /// The same for another locale.
  std::shared_ptr<const RegisteredGroup> relocalized(const RecordContext& context) const {
    return make(applicationRegistration, registrations, containers, context);
  }
  /// The path of the application, or of the plug-in that is in none.
  const std::string& root() const {
    return (applicationRegistration ? applicationRegistration : registrations.front())->path;
  }
};

using RegisteredGroupPtr = std::shared_ptr<const RegisteredGroup>;

}  // namespace platform
