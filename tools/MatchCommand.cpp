#include "tools/MatchCommand.h"

#include "tools/Json.h"
#include "tools/PlugInText.h"
#include "tools/RuleArguments.h"

namespace tools {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr const char* kRulesHelp = R"(Rules
  A rule is KEY=PATTERN. Every rule must hold; a KEY given more than once offers its
  patterns as alternatives. Rules of --rule replace those of --rules for the same key.

  KEY is an attribute of the plug-in (HXExtensionAttributes), else a key of its
  Info.plist, or one of:
    HXExtensionIdentifier      the plug-in's identifier
    com.orvane.uuid            its UUID, in upper case
    HXUserElection             the user's election; 0 when there is none
    HXExtensionContainingApp   the path of the application that contains it
    ENTITLEMENT:NAME           its entitlement NAME

  PATTERN is true (there is a value and it is not false), false, or text:
    TEXT or =TEXT   equal           <>TEXT   different
    <TEXT  <=TEXT   before          >TEXT  >=TEXT   after
    ?KD-CONFORMS:TYPE  the value is a type that conforms to TYPE
    ?KD-IS:TYPE        TYPE conforms to the value
  Numbers inside a text compare by value: 1.10 comes after 1.9.

Examples
  xtctl match
  xtctl match --rule HXExtensionPointName=com.example.photo-editing
  xtctl match --rule 'HXExtensionVersion=>=1.9' --all-versions
  xtctl match --rule ENTITLEMENT:com.orvane.developer.auto-elect-plugin=true --json)";

}  // namespace

CLI::App* MatchCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("match", "List the plug-ins that this program, as a host, is offered");
  addRuleOptions(*command, rules_, rulesFile_);
  command->add_flag("--all-versions", allVersions_, "Every version of a plug-in, not only the newest");
  command->add_flag("--duplicates", duplicates_, "With --all-versions: plug-ins of equal version too");
  command->add_flag("--system-only", systemOnly_, "Only plug-ins on the system volume");
  command->add_flag("--all", all_, "Also what is held or kept for other hosts (managers only)");
  command->add_flag("--json", json_, "A JSON array of export forms instead of a table");
  command->footer(kRulesHelp);
  return command;
}

ExitStatus MatchCommand::run(DaemonSession& daemon, std::string& out) {
  std::string fault;
  const std::optional<Dictionary> rules = rulesOf(rules_, rulesFile_, fault);
  if (rules && duplicates_ && !allVersions_) fault = "--duplicates needs --all-versions";
  if (!fault.empty()) {
    complain(fault);
    return ExitStatus::Usage;
  }

  std::uint64_t flags = extora::XTDiscoverSynchronously;
  if (allVersions_) flags |= extora::XTDiscoverAllVersions;
  if (duplicates_) flags |= extora::XTDiscoverDuplicates;
  if (systemOnly_) flags |= extora::XTDiscoverSystemOnly;
  if (all_) flags |= extora::XTDiscoverAll;
  Value found;
  const ExitStatus status = daemon.match(*rules, flags, found);
  if (status != ExitStatus::Success) return status;

  const auto forms = sortedForms(found);
  if (json_) {
    out += jsonText(platform::Array(forms));
  } else if (forms.empty()) {
    out += rules->empty() ? "No plug-ins are offered.\n" : "No plug-ins match.\n";
  } else {
    out += plugInTable(forms);
  }
  return ExitStatus::Success;
}

}  // namespace tools
