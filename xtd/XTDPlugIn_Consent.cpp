// What the user has granted to the plug-in's application.
#include "Extora/XTLog.h"
#include "platform/bundle/PlatformBundle.h"
#include "platform/consent/ConsentService.h"
#include "xtd/XTDPlugIn.h"
#include "xtd/XTDatabase.h"

namespace extora {

using platform::PlatformBundle;

std::set<std::string> XTDPlugIn::allowedConsentServices() const {
  const std::shared_ptr<XTDatabase> database = database_.lock();
  if (!containingUrl() || !database) return {};
  const auto bundle = PlatformBundle::create(containingUrl()->path(), PlatformBundle::PathKind::Bundle);
  if (!bundle->property(PlatformBundle::Property::BundlePath)) {
    XTLogOps().info("failed to create bundle for {}", path());
    return {};
  }
  bundle->dropCaches();
  const auto records = database->platformServices()->consent->consentInfoForBundle(*bundle);
  if (!records) {
    XTLogOps().info("ConsentAccessCopyInformationForBundle failed for {}", *bundle);
    return {};
  }
  std::set<std::string> services;
  for (const platform::ConsentRecord& record : *records) {
    if (record.granted.value_or(false)) services.insert(record.service);
  }
  return services;
}

}  // namespace extora
