#include <cstdlib>
#include <iterator>

#include "Extora/XTBundle.h"
#include "Extora/XTExtensionPoints.h"
#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "platform/jobs/JobManager.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDPlugIn.h"
#include "xtd/XTDServer.h"

namespace extora {

namespace {

constexpr const char* kKeyboardNetworkConsent = "com.orvane.consent.keyboard-network";

}  // namespace

std::string_view XTDPlugIn::sandboxProfile() const {
  const std::string declared = pluginKey(XTSDKInfoKey).string();
  if (declared == XTExtensionPoints::kKeyboardService) {
    const Value openAccess = attribute("RequestsOpenAccess");
    const bool granted = openAccess == Value(true) && allowedConsentServices().count(kKeyboardNetworkConsent) != 0;
    return granted ? XTExtensionPoints::kDefaultProfile : "keyboard";
  }
  if (declared == XTExtensionPoints::kNetguardFilterData) return "network-filter";
  const std::string& registered = plugInDictionary()[XTSDKInfoKey].string();
  return XTExtensionPoints::sandboxProfile(registered).value_or(XTExtensionPoints::kDefaultProfile);
}

std::optional<Error> XTDPlugIn::enableForClient(XTDIpcClient& client, const Value& environment) const {
  Dictionary variables(environment);
  const std::string versionText = version().value_or("(null)");
  if (const auto container = dataContainerURL()) {
    variables.set("HOME", container->path());
    variables.set("HBFIXED_USER_HOME", container->path());
    variables.set("TMPDIR", container->appending("tmp").path());
  } else {
    XTLogOps().debug("no data container for plug-in {}({}) {} at {}", identifier(), versionText, uuid(), path());
  }
  const std::string_view profile = sandboxProfile();
  if (const char* sdk = std::getenv("XTTEST_SDK")) variables.set("XTTEST_SDK", sdk);

  Dictionary service;
  if (const Value raw = infoKey("IPCService"); raw.isDictionary()) {
    XTLogAr().debug("raw IPCService={}", raw);
    service = Dictionary(raw);
  } else {
    XTLogOps().info("no IPCService for plug-in; database returned {}", raw);
  }
  for (const auto& entry : service["EnvironmentVariables"].entries()) variables.set(entry.key, entry.value);
  service.set("EnvironmentVariables", variables);
  service.set("_SandboxProfile", profile);
  service.set("_OmitSandboxParameters", true);
  XTLogOps().info("assigning plug-in {}({}) {} to {} sandbox", identifier(), versionText, uuid(), profile);
  const Value overlay = Dictionary{{"IPCService", service}, {"HBBundlePackageType", "IPC!"}};
  XTLogOps().def("allowing host {} {} to use plug-in {}({}) uuid={} at {}", client.pid(), client.path(), identifier(),
                 versionText, uuid(), path());

  const auto bundle = XTBundle::initWithURL(url());
  const auto executable = bundle->executablePath();
  if (!executable) {
    XTLogOps().error("failed to obtain execPath for plug-in {}({}) bundle={}", *this, uuid(), *bundle);
    return makeErrorWithFormat(XTErrorRequest, "cannot obtain executable path for plug-in {}({})", identifier(),
                               uuid());
  }
  XTLogOps().debug("activation overlay={}", overlay);
  const int result =
      client.server()->platformServices()->jobs->jobAddExternalService(client.peer(), *executable, overlay);
  if (result == 0) return std::nullopt;
  XTLogOps().error("jobmgr error {} trying to allow {} {} to use plug-in {}({}) uuid={} at {}", result, client.pid(),
                   client.path(), identifier(), versionText, uuid(), path());
  return makeErrorWithFormat(XTErrorRequest, "unable to enable plug-in {}({})", identifier(), uuid());
}

}  // namespace extora
