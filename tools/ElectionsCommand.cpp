#include "tools/ElectionsCommand.h"

#include "Extora/XTVocabulary.h"
#include "tools/Election.h"
#include "tools/Json.h"
#include "tools/PlugInText.h"
#include "tools/Table.h"

namespace tools {

using platform::Array;
using platform::Dictionary;
using platform::Value;

CLI::App* ElectionsCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("elections", "List the plug-ins for which there is an election");
  command->add_flag("--all", all_, "Also plug-ins that this program is not offered (managers only)");
  command->add_flag("--json", json_, "A JSON array of objects instead of a table");
  command->footer(R"(FLAGS "auto": the plug-in's entitlement elects it, so that it is elected for use again after
`clear` as soon as the daemon makes a new record of it (at its next start, for instance).)");
  return command;
}

ExitStatus ElectionsCommand::run(DaemonSession& daemon, std::string& out) {
  std::uint64_t flags = extora::XTDiscoverSynchronously | extora::XTDiscoverAllVersions | extora::XTDiscoverDuplicates;
  if (all_) flags |= extora::XTDiscoverAll;
  Value forms;
  const ExitStatus status = daemon.match({}, flags, forms);
  if (status != ExitStatus::Success) return status;

  Table table({"ELECTION", "IDENTIFIER", "VERSION", "UUID", "FLAGS", "PATH"});
  Array list;
  for (const Value& form : sortedForms(forms)) {
    const Value& election = form[extora::XTAnnotationsFormKey][extora::XTAnnotationElectionKey];
    if (electionText(election) == "none") continue;
    const bool automatic = form[extora::XTEntitlementsFormKey][extora::XTAutoElectEntitlement].booleanValue();
    const std::string& identifier = form[extora::XTIdentifierFormKey].string();
    const std::string& version = form[extora::XTVersionFormKey].string();
    const std::string& uuid = form[extora::XTUUIDFormKey].string();
    const std::string& path = form[extora::XTPathFormKey].string();
    table.addRow({electionText(election), identifier, version, uuid, automatic ? "auto" : "", path});
    list.append(Dictionary{{extora::XTAnnotationElectionKey, election},
                           {extora::XTIdentifierFormKey, identifier},
                           {extora::XTVersionFormKey, version},
                           {extora::XTUUIDFormKey, uuid},
                           {extora::XTPathFormKey, path},
                           {"auto", automatic}});
  }
  if (json_) {
    out += jsonText(list);
  } else {
    out += list.size() == 0 ? "There are no elections.\n" : table.text();
  }
  return ExitStatus::Success;
}

}  // namespace tools
