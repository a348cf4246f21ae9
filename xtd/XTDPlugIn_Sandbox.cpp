#include <cstring>

#include "Extora/XTLog.h"
#include "platform/sandbox/Sandbox.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

namespace {

constexpr const char* kServiceExtensionClass = "com.orvane.extora.plugin-service";

}  // namespace

std::optional<std::string> XTDPlugIn::issueFileExtension(platform::Sandbox& sandbox, const Url& location,
                                                         int* errorNumber) const {
  auto token = sandbox.issueFileReadExtension(location.path(), path(), errorNumber);
  if (token) {
    XTLogSandbox().debug("issued file extension for {} -> {}", location.path(), platform::shownToken(*token));
  }
  return token;
}

std::optional<std::string> XTDPlugIn::issueServiceExtension(platform::Sandbox& sandbox, const std::string& name,
                                                            int* errorNumber) const {
  auto token = sandbox.issueServiceExtension(kServiceExtensionClass, name, errorNumber);
  if (token) XTLogSandbox().debug("issued mach extension for {} -> {}", name, platform::shownToken(*token));
  return token;
}

Dictionary XTDPlugIn::issueResourceExtensions(platform::Sandbox& sandbox, const Value& paths) const {
  const Value list = paths.isString() ? Value(platform::Array{paths}) : paths;
  Dictionary tokens;
  for (const Value& element : list.items()) {
    if (!element.isString()) continue;
    const Url location = element.string() == "." ? url() : url().appending(element.string());
    int errorNumber = 0;
    if (auto token = issueFileExtension(sandbox, location, &errorNumber)) {
      tokens.set(element.string(), *token);
    } else {
      XTLogOps().info("failed to make extension for {} in plug-in at {}: {}", location.path(), path(),
                      std::strerror(errorNumber));
    }
  }
  return tokens;
}

void XTDPlugIn::augmentForm(platform::Sandbox& sandbox, Dictionary& form) const {
  const Value shared = isAppExtension() ? Value(platform::Array{"."}) : pluginKey(XTSharedResourcesInfoKey);
  if (!shared.isNothing()) form.set(XTExtensionsFormKey, issueResourceExtensions(sandbox, shared));
  if (isData()) return;
  const std::string name = infoKey(HBBundleIdentifierKey).string();
  int errorNumber = 0;
  if (auto token = issueServiceExtension(sandbox, name, &errorNumber)) {
    form.set(XTServiceExtensionFormKey, *token);
  } else {
    XTLogOps().info("failed to make mach extension for {} in plug-in at {}: {}", name, path(),
                    std::strerror(errorNumber));
  }
}

}  // namespace extora
