#include "tools/FindCommand.h"

#include <filesystem>

#include "platform/files/Files.h"
#include "tools/Json.h"
#include "tools/PlugInText.h"

namespace tools {

using platform::Url;
using platform::Uuid;
using platform::Value;

PlugInReference PlugInReference::parse(const std::string& text) {
  PlugInReference reference;
  reference.uuid = Uuid::parse(text);
  if (reference.uuid || text.empty()) return reference;
  if (text.find("://") != std::string::npos || text.rfind("file:", 0) == 0) {
    reference.url = Url::parse(text);
    return reference;
  }
  std::error_code error;
  const auto absolute = std::filesystem::absolute(text, error).lexically_normal().string();
  if (!error) reference.url = Url::file(platform::Files::make()->resolvePath(absolute).value_or(absolute));
  return reference;
}

CLI::App* FindCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("find", "Show one plug-in, whether or not it would be offered");
  command->add_option("plug-in", what_, "UUID, path or file URL of a plug-in bundle")
      ->required()
      ->option_text("UUID|PATH|URL")
      ->check([](const std::string& text) -> std::string {
        const auto reference = PlugInReference::parse(text);
        return reference.uuid || reference.url ? "" : "\"" + text + "\" is no UUID, path or file URL";
      });
  command->add_flag("--json", json_, "The export form as a JSON object instead of a page");
  command->footer(R"(Examples
  xtctl find 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8
  xtctl find Mail.app/PlugIns/Filter.appex
  xtctl find file:///usr/share/extora/Applications/Mail.app/PlugIns/Filter.appex --json)");
  return command;
}

ExitStatus FindCommand::run(DaemonSession& daemon, std::string& out) {
  const auto reference = PlugInReference::parse(what_);
  Value reply;
  const ExitStatus status = daemon.ask(
      [&](auto& client, const auto& answer) {
        if (reference.uuid) {
          client.findPlugInByUUID(*reference.uuid, answer);
        } else {
          client.findPlugInByPathURL(*reference.url, answer);
        }
      },
      reply);
  if (status != ExitStatus::Success) return status;

  const Value form = daemon.matches(reply);
  if (!form.isDictionary()) {
    complain("the daemon knows this plug-in but could not describe it; its log says why");
    return ExitStatus::Refused;
  }
  out += json_ ? jsonText(form) : plugInPage(form);
  return ExitStatus::Success;
}

}  // namespace tools
