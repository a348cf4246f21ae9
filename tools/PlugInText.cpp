#include "tools/PlugInText.h"

#include <fmt/format.h>

#include <algorithm>

#include "Extora/XTPlugInCore.h"
#include "platform/log/Log.h"
#include "platform/value/DateText.h"
#include "platform/value/NumericOrder.h"
#include "tools/Table.h"

namespace tools {

using extora::XTPlugInCore;
using platform::Value;

namespace {

// A form with the record built from it. A plug-in of the old configuration style builds none: what its form says is
// shown all the same.
struct PlugIn {
  explicit PlugIn(const Value& exported) : form(exported), record(XTPlugInCore::initWithForm(exported)) {}

  const std::string& text(std::string_view key) const { return form[key].string(); }
  const std::string& name() const {
    const std::string& name = text(extora::XTLocalizedNameFormKey);
    return name.empty() ? text(extora::XTIdentifierFormKey) : name;
  }
  std::string extensionPoint() const {
    return record ? record->sdkSpec().string() : form[extora::XTInfoFormKey][extora::XTSDKInfoKey].string();
  }
  const Value& election() const { return form[extora::XTAnnotationsFormKey][extora::XTAnnotationElectionKey]; }

  Value form;
  std::shared_ptr<XTPlugInCore> record;
};

std::string identifierOf(const std::string& uuid, const std::vector<Value>& forms) {
  for (const Value& form : forms) {
    if (form[extora::XTUUIDFormKey].string() == uuid) return form[extora::XTIdentifierFormKey].string();
  }
  return uuid;
}

std::string flags(const PlugIn& plugIn, const std::vector<Value>& forms) {
  std::vector<std::string> words;
  if (plugIn.form[extora::XTSystemResidentFormKey].booleanValue()) words.emplace_back("system");
  if (!plugIn.text(extora::XTContainingPathFormKey).empty()) words.emplace_back("app");
  if (!plugIn.record) words.emplace_back("old-style");
  if (plugIn.record && plugIn.record->isData()) words.emplace_back("data");
  if (plugIn.record && plugIn.record->isDedicated()) words.emplace_back("dedicated");
  if (plugIn.election()) words.push_back(fmt::format("election={}", plugIn.election()));
  if (const auto& uuid = plugIn.text(extora::XTOverriderFormKey); !uuid.empty()) {
    words.push_back("overridden-by=" + identifierOf(uuid, forms));
  }
  if (const auto& other = plugIn.text(extora::XTOverridingFormKey); !other.empty()) {
    words.push_back("overrides=" + other);
  }
  return fmt::format("{}", fmt::join(words, ","));
}

class Page {
 public:
  void title(const std::string& text) { out_ += platform::escapeControlCharacters(text) + "\n"; }
  // Nothing is written for an empty text.
  void line(std::string_view label, const std::string& text) {
    if (!text.empty()) out_ += fmt::format("  {:<20}{}\n", label, platform::escapeControlCharacters(text));
  }
  // One line an entry, the label only on the first.
  void lines(std::string_view label, const Value& dictionary) {
    for (const auto& [key, value] : dictionary.entries()) {
      line(label, fmt::format("{} = {}", key, value));
      label = "";
    }
  }
  std::string take() { return std::move(out_); }

 private:
  std::string out_;
};

}  // namespace

std::vector<Value> sortedForms(const Value& forms) {
  std::vector<Value> sorted(forms.items().begin(), forms.items().end());
  std::sort(sorted.begin(), sorted.end(), [](const Value& a, const Value& b) {
    for (const std::string_view key : {extora::XTIdentifierFormKey, extora::XTVersionFormKey, extora::XTUUIDFormKey}) {
      const auto order = platform::compareNumeric(a[key].string(), b[key].string());
      if (order != 0) return order < 0;
    }
    return false;
  });
  return sorted;
}

std::string plugInTable(const std::vector<Value>& forms) {
  Table table({"NAME", "IDENTIFIER", "VERSION", "EXTENSION POINT", "UUID", "FLAGS", "PATH"});
  for (const Value& form : forms) {
    const PlugIn plugIn(form);
    table.addRow({plugIn.name(), plugIn.text(extora::XTIdentifierFormKey), plugIn.text(extora::XTVersionFormKey),
                  plugIn.extensionPoint(), plugIn.text(extora::XTUUIDFormKey), flags(plugIn, forms),
                  plugIn.text(extora::XTPathFormKey)});
  }
  return table.text();
}

std::string plugInPage(const Value& form) {
  const PlugIn plugIn(form);
  const std::string& identifier = plugIn.text(extora::XTIdentifierFormKey);
  const std::string& original = plugIn.text(extora::XTOriginalIdentifierFormKey);
  const std::string& path = plugIn.text(extora::XTPathFormKey);
  const std::string& application = plugIn.text(extora::XTContainingPathFormKey);
  const std::string& applicationName = plugIn.text(extora::XTLocalizedContainingNameFormKey);
  const platform::Date registered{form[extora::XTLastModifiedFormKey].integerValue(), 0};

  Page page;
  page.title(plugIn.name());
  page.line("identifier", identifier);
  page.line("original identifier", original == identifier ? "" : original);
  page.line("version", plugIn.text(extora::XTVersionFormKey));
  page.line("UUID", plugIn.text(extora::XTUUIDFormKey));
  page.line("extension point", plugIn.extensionPoint());
  if (plugIn.record) page.line("protocol", plugIn.record->protocolSpec().string());
  page.line("flags", flags(plugIn, {}));
  page.line("path", path);
  page.line("application", application.empty() || applicationName.empty()
                               ? application
                               : fmt::format("{} ({})", applicationName, application));
  page.line("registered", platform::dateText(registered).value_or(""));
  page.lines("annotations", form[extora::XTAnnotationsFormKey]);
  page.lines("attributes", form[extora::XTInfoFormKey][extora::XTAttributesInfoKey]);
  page.lines("entitlements", form[extora::XTEntitlementsFormKey]);
  std::vector<std::string> shared;
  for (const auto& entry : form[extora::XTExtensionsFormKey].entries()) shared.push_back(entry.key);
  page.line("shares", fmt::format("{}", fmt::join(shared, ", ")));
  return page.take();
}

}  // namespace tools
