#include "tools/PlugInReference.h"

#include <fmt/format.h>

#include <filesystem>

#include "Extora/XTVocabulary.h"
#include "platform/files/Files.h"
#include "tools/Command.h"

namespace tools {

using platform::Dictionary;
using platform::Url;
using platform::Uuid;
using platform::Value;

PlugInReference PlugInReference::parse(const std::string& text) {
  PlugInReference reference;
  reference.text = text;
  reference.uuid = Uuid::parse(text);
  if (reference.uuid || text.empty()) return reference;
  if (text.find("://") != std::string::npos || text.rfind("file:", 0) == 0) {
    reference.url = Url::parse(text);
    return reference;
  }
  std::error_code error;
  if (text.find('/') == std::string::npos && !std::filesystem::exists(text, error)) return reference;
  reference.url = Url::file(absolutePaths({text})[0]);
  return reference;
}

ExitStatus PlugInReference::find(DaemonSession& daemon, Value& form) const {
  if (isIdentifier()) {
    const Dictionary rules{{extora::XTIdentifierAttribute, "=" + text}};
    Value forms;
    if (const ExitStatus status = daemon.match(rules, 0, forms); status != ExitStatus::Success) return status;
    for (const Value& each : forms.items()) {
      if (each[extora::XTIdentifierFormKey].string() != text) continue;
      form = each;
      return ExitStatus::Success;
    }
    complain(fmt::format("no plug-in with the identifier {} is offered here; name it by UUID or path", text));
    return ExitStatus::Refused;
  }
  Value reply;
  const ExitStatus status = daemon.ask(
      [&](auto& client, const auto& answer) {
        uuid ? client.findPlugInByUUID(*uuid, answer) : client.findPlugInByPathURL(*url, answer);
      },
      reply);
  if (status != ExitStatus::Success) return status;
  form = daemon.matches(reply);
  if (form.isDictionary()) return ExitStatus::Success;
  complain("the daemon knows this plug-in but could not describe it; its log says why");
  return ExitStatus::Refused;
}

std::vector<std::string> absolutePaths(const std::vector<std::string>& paths) {
  std::vector<std::string> result;
  for (const auto& path : paths) {
    std::error_code error;
    const auto absolute = std::filesystem::absolute(path, error).lexically_normal().string();
    result.push_back(error ? path : platform::Files::make()->resolvePath(absolute).value_or(absolute));
  }
  return result;
}

std::string plugInReferenceFault(const std::string& text) {
  if (text.empty()) return "an empty text names no plug-in";
  const auto reference = PlugInReference::parse(text);
  const bool url = text.find("://") != std::string::npos || text.rfind("file:", 0) == 0;
  return reference.isIdentifier() && url ? "\"" + text + "\" is no file URL" : "";
}

}  // namespace tools
