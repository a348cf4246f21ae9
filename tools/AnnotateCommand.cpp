#include "tools/AnnotateCommand.h"

#include <fmt/format.h>

#include "Extora/XTVocabulary.h"
#include "platform/log/Log.h"
#include "tools/Activation.h"
#include "tools/Json.h"
#include "tools/PlugInReference.h"
#include "tools/RuleArguments.h"

namespace tools {

using platform::Dictionary;
using platform::Value;

namespace {

std::string page(const Value& form) {
  std::string text = platform::escapeControlCharacters(
      fmt::format("{} {}  {}", form[extora::XTIdentifierFormKey].string(), form[extora::XTVersionFormKey].string(),
                  form[extora::XTUUIDFormKey].string()));
  text += '\n';
  const Value& annotations = form[extora::XTAnnotationsFormKey];
  if (annotations.size() == 0) return text + "  nothing\n";
  for (const auto& [key, value] : annotations.entries()) {
    if (!value.isDictionary()) text += platform::escapeControlCharacters(fmt::format("  {} = {}", key, value)) + "\n";
    for (const auto& inner : value.entries()) {
      text += platform::escapeControlCharacters(fmt::format("  {}: {} = {}", key, inner.key, inner.value)) + "\n";
    }
  }
  return text;
}

}  // namespace

CLI::App* AnnotateCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("annotate", "Show or change what is noted about plug-ins");
  command->add_option("plug-ins", plugIns_, "UUIDs, paths, file URLs or identifiers")
      ->required()
      ->option_text("PLUGIN...")
      ->check(plugInReferenceFault);
  command->add_option("-s,--set", set_, "Note VALUE under KEY: true, false, a whole number, else text")
      ->option_text("KEY=VALUE")
      ->check([](const std::string& note) { return ruleFault(note, "a note is KEY=VALUE"); })
      ->allow_extra_args(false);
  command->add_option("-d,--delete", remove_, "Forget what is noted under KEY")
      ->option_text("KEY")
      ->allow_extra_args(false);
  command->add_option("--file", file_, "Note the dictionary of an XML property list instead of what is noted")
      ->option_text("FILE");
  command->add_flag("--clear", clear_, "Forget all that is noted before anything is set");
  command->add_flag("--json", json_, "A JSON array of objects instead of text");
  command->footer(R"(Without a change it shows what is noted. Notes belong to hosts; the daemon keeps them for all
versions of a plug-in, and over its removal. `xtctl elect` changes the election, which
stands beside them.

Examples
  xtctl annotate com.example.mail.filter
  xtctl annotate com.example.mail.filter --set color=red --set level=3
  xtctl annotate com.example.mail.filter --delete color
  xtctl annotate Mail.app/PlugIns/*.appex --file notes.plist)");
  return command;
}

ExitStatus AnnotateCommand::run(DaemonSession& daemon, std::string& out) {
  std::string fault;
  const std::optional<Dictionary> replacement = file_.empty() ? Dictionary() : dictionaryFromFile(file_, fault);
  if (!replacement) {
    complain(fault);
    return ExitStatus::Usage;
  }
  std::vector<Value> forms;
  Dictionary notes;
  for (const std::string& each : plugIns_) {
    Value form;
    const ExitStatus status = PlugInReference::parse(each).find(daemon, form);
    if (status != ExitStatus::Success) return status;
    const Value& noted = form[extora::XTAnnotationsFormKey][extora::XTAnnotationExtensionKey];
    Dictionary extension = clear_ || !file_.empty() ? *replacement : Dictionary(noted);
    for (const std::string& key : remove_) extension.remove(key);
    for (const std::string& entry : set_) {
      const std::size_t equals = entry.find('=');
      extension.set(entry.substr(0, equals), typedValue(entry.substr(equals + 1)));
    }
    notes.set(form[extora::XTUUIDFormKey].string(), extension);
    if (changes()) {
      Dictionary annotations(form[extora::XTAnnotationsFormKey]);
      annotations.set(extora::XTAnnotationExtensionKey, extension);
      Dictionary changed(form);
      changed.set(extora::XTAnnotationsFormKey, annotations);
      form = changed;
    }
    forms.push_back(std::move(form));
  }
  if (changes()) {
    Value reply;
    const ExitStatus status =
        daemon.ask([&](auto& client, const auto& answer) { client.bulkSetPluginAnnotations(notes, answer); }, reply);
    if (status != ExitStatus::Success) return status;
  }
  platform::Array list;
  for (const Value& form : forms) {
    if (!json_) out += page(form);
    Dictionary record;
    for (const auto key : {extora::XTUUIDFormKey, extora::XTIdentifierFormKey, extora::XTAnnotationsFormKey}) {
      record.set(key, form[key]);
    }
    list.append(record);
  }
  if (json_) out += jsonText(list);
  return ExitStatus::Success;
}

}  // namespace tools
