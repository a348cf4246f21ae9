// What can be wrong with a record, so that its plug-in is left out.
#include "Extora/XTPlugInCore.h"
#include "Extora/XTProtocol.h"

namespace extora {
namespace {

constexpr const char* kMissing = "missing \"{}\" key in Info.plist or SDK";
constexpr std::string_view kSystemFolder = "/System/";

}  // namespace

std::optional<Error> XTPlugInCore::diagnose() const {
  const auto problems = configurationProblems();
  return problems.empty() ? std::nullopt : std::optional(problems.front().error);
}

std::vector<XTPlugInCore::Problem> XTPlugInCore::configurationProblems() const {
  std::vector<Problem> problems;
  const auto add = [&](std::string_view key, const char* text) {
    problems.push_back({key, makeErrorWithFormat(XTErrorConfiguration, fmt::runtime(text), key)});
  };
  if (identifier_.empty()) {
    add(HBBundleIdentifierKey, "missing identifier (no HXExtensionIdentifier, nor even HBBundleIdentifier)");
  }
  if (protocolSpec().isNothing()) add(XTProtocolInfoKey, kMissing);
  if (attributes().isNothing()) add(XTAttributesInfoKey, kMissing);
  if (isAppExtension() && principalSpec().string() != XTObjectClassName) {
    add(XTPrincipalClassInfoKey, "Application Extensions may not use the \"{}\" key");
  }
  if (!pluginKey(XTPassProxyInfoKey).isNothing()) {
    add(XTPassProxyInfoKey, "the \"{}\" key is not supported on this platform");
  }
  if (isHybrid()) add(XTEmbeddedCodeInfoKey, "hybrid plug-ins are not supported on this platform");
  return problems;
}

std::vector<XTPlugInCore::Problem> XTPlugInCore::installationProblems() const {
  std::vector<Problem> problems;
  if (!isData() && !dataContainerURL()) {
    problems.push_back({{}, makeError(XTErrorConfiguration, "this plug-in has no sandbox data container")});
  }
  if (!containingUrl() && !path().starts_with(kSystemFolder)) {
    problems.push_back({{}, makeError(XTErrorConfiguration, "plug-ins outside containing apps must be in /System")});
  }
  return problems;
}

}  // namespace extora
