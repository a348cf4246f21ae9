// The daemon tells a host what it is offered, and not what it is not. So the question is asked again and again, each
// time with one condition less, until the condition that makes the difference is found.
#include "tools/WhyCommand.h"

#include <fmt/format.h>

#include "Extora/XTUtilities.h"
#include "Extora/XTVocabulary.h"
#include "platform/files/Directories.h"
#include "platform/log/Log.h"
#include "platform/preferences/Preferences.h"
#include "tools/Activation.h"
#include "tools/Election.h"
#include "tools/PlugInReference.h"
#include "tools/RuleArguments.h"

namespace tools {

using extora::XTDaemonClient;
using platform::Dictionary;
using platform::Value;

namespace {

std::string nameOf(const Value& form) {
  return fmt::format("{} {}", form[extora::XTIdentifierFormKey], form[extora::XTVersionFormKey]);
}

// Why hosts like this one are not offered the plug-in though it is asked for by its UUID alone.
std::string hostReason(DaemonSession& daemon, const Value& form) {
  const Value& application = form[extora::XTContainingPathFormKey];
  if (!application && !form[extora::XTSystemResidentFormKey].booleanValue()) {
    return "it lies in no application and not on the system volume";
  }
  const auto ready = daemon.request(
      [&](auto& client, const auto& answer) { client.readyPlugIns(plugInsOf({form}), true, 0, {}, answer); });
  if (const auto error = XTDaemonClient::errorInReply(ready); error && error->code == extora::XTErrorNotPermitted) {
    const std::string text = error->localizedDescription();
    const std::size_t reason = text.find(" denied: ");
    return reason == std::string::npos ? text : text.substr(reason + 9);
  }
  if (form[extora::XTInfoFormKey][extora::XTDedicatedInfoKey].booleanValue()) {
    return fmt::format("it is dedicated: only hosts in {} are offered it", application);
  }
  const auto preferences = platform::Preferences::make(platform::Directories::forClient(daemon.service()));
  const Value exclusions = preferences->preferenceValue(std::string(extora::XTPreferenceDomain),
                                                        std::string(extora::XTExclusionsPreferenceKey));
  if (exclusions.size() != 0) return "the user has excluded it: see `xtctl exclusions`";
  return "the daemon's log says why (EXTORA_LOG=ops=info)";
}

// Why `rival` is offered in the place of a plug-in of the same identifier.
std::string rivalReason(const Value& form, const Value& rival) {
  const auto order =
      extora::compareVersionString(rival[extora::XTVersionFormKey].string(), form[extora::XTVersionFormKey].string());
  const char* why = "it comes first for this host";
  if (order > 0) why = "it is newer";
  if (order == 0) why = "of equals the system's own comes first, then the one that was installed last";
  return fmt::format("{} at {} is offered instead: {}", nameOf(rival), rival[extora::XTPathFormKey], why);
}

}  // namespace

CLI::App* WhyCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("why", "Say why a plug-in is offered to this program, or why not");
  command->add_option("plug-in", what_, "UUID, path or file URL of a plug-in bundle; or an identifier")
      ->required()
      ->option_text("PLUGIN")
      ->check(plugInReferenceFault);
  addRuleOptions(*command, rules_, rulesFile_);
  command->footer(R"(Whether a plug-in is offered depends on the host and on the rules that it matches by: give its
rules, and mind that this program has no entitlements of its own. The exit status is 0 when the
plug-in is offered, else 1.

Examples
  xtctl why Mail.app/PlugIns/Filter.appex
  xtctl why com.example.mail.filter --rule HXUserElection=1)");
  return command;
}

ExitStatus WhyCommand::run(DaemonSession& daemon, std::string& out) {
  std::string fault;
  const auto rules = rulesOf(rules_, rulesFile_, fault);
  if (!rules) {
    complain(fault);
    return ExitStatus::Usage;
  }
  const PlugInReference reference = PlugInReference::parse(what_);
  Value form;
  if (const ExitStatus status = reference.find(daemon, form); status != ExitStatus::Success) {
    if (status == ExitStatus::Refused && reference.url) {
      complain(
          "`xtctl lint` says what is wrong with a bundle; one that lies in no folder of applications needs "
          "`xtctl add`");
    }
    return status;
  }
  const std::string name = platform::escapeControlCharacters(nameOf(form));
  const auto notOffered = [&](const std::string& reason) {
    out += name + ": not offered\n  " + platform::escapeControlCharacters(reason) + "\n";
    return ExitStatus::Refused;
  };

  const Value& uuid = form[extora::XTUUIDFormKey];
  Value forms;
  ExitStatus status = daemon.match({{extora::XTUUIDAttribute, uuid}}, 0, forms);
  if (status != ExitStatus::Success) return status;
  if (forms.size() == 0) return notOffered(hostReason(daemon, form));

  for (const auto& [key, pattern] : *rules) {
    status = daemon.match({{extora::XTUUIDAttribute, uuid}, {key, pattern}}, 0, forms);
    if (status != ExitStatus::Success) return status;
    if (forms.size() != 0) continue;
    std::string reason = fmt::format("the rule {} = {} does not hold", key, pattern);
    if (key == extora::XTUserElectionAttribute) {
      reason +=
          "; its election is " + electionText(form[extora::XTAnnotationsFormKey][extora::XTAnnotationElectionKey]);
    }
    return notOffered(reason);
  }

  Dictionary all = *rules;
  if (!all.contains(extora::XTIdentifierAttribute)) {
    all.set(extora::XTIdentifierAttribute, "=" + form[extora::XTIdentifierFormKey].string());
  }
  status = daemon.match(all, 0, forms);
  if (status != ExitStatus::Success) return status;
  const Value* rival = nullptr;
  for (const Value& each : forms.items()) {
    if (each[extora::XTUUIDFormKey] == uuid) {
      out += name + ": offered\n";
      return ExitStatus::Success;
    }
    if (each[extora::XTIdentifierFormKey] == form[extora::XTIdentifierFormKey]) rival = &each;
  }
  return notOffered(rival != nullptr ? rivalReason(form, *rival) : "it was, a moment ago");
}

}  // namespace tools
