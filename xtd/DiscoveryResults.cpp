#include "xtd/DiscoveryResults.h"

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "Extora/XTUtilities.h"

namespace extora {

bool DiscoveryResults::keepsAllVersions() const {
  return (flags_ & XTDiscoverAllVersions) != 0;
}

bool DiscoveryResults::keepsDuplicates() const {
  return keepsAllVersions() && (flags_ & XTDiscoverDuplicates) != 0;
}

DiscoveryResults::Entry* DiscoveryResults::first(Line& line) {
  while (line.head < line.entries.size() && entries_[line.entries[line.head]].removed) ++line.head;
  return line.head < line.entries.size() ? &entries_[line.entries[line.head]] : nullptr;
}

// The form that decides about the plug-in: the first of its identifier or, when all versions are kept, the first of
// these whose version compares equal. A plug-in without a version compares equal to every form.
DiscoveryResults::Entry* DiscoveryResults::rivalOf(const XTPlugInCore& plugIn, Identifier& identifier) {
  if (!keepsAllVersions()) return first(identifier.all);
  const auto version = plugIn.version();
  if (!version) return first(identifier.all);
  const auto found = identifier.byVersion.find(platform::withoutLeadingZeros(*version));
  return found == identifier.byVersion.end() ? nullptr : first(found->second);
}

bool DiscoveryResults::isPreferred(const XTPlugInCore& plugIn, const Entry& entry) {
  if (plugIn.onSystemVolume() != entry.systemResident) return plugIn.onSystemVolume();
  return plugIn.lastModified() > entry.lastModified;
}

bool DiscoveryResults::admit(const XTPlugInCore& plugIn) {
  if (keepsDuplicates()) return true;
  const auto identifier = identifiers_.find(plugIn.identifier());
  if (identifier == identifiers_.end()) return true;
  Entry* rival = rivalOf(plugIn, identifier->second);
  if (rival == nullptr) return true;
  auto order = std::weak_ordering::equivalent;
  if (const auto version = plugIn.version()) order = compareVersionString(*version, rival->version);
  if (order < 0 || (order == 0 && !isPreferred(plugIn, *rival))) return false;
  rival->removed = true;
  return true;
}

void DiscoveryResults::append(const XTPlugInCore& plugIn, Dictionary form) {
  const std::size_t index = entries_.size();
  Entry& entry = entries_.emplace_back();
  entry.version = form[XTVersionFormKey].string();
  entry.systemResident = form[XTSystemResidentFormKey].booleanValue();
  entry.lastModified = form[XTLastModifiedFormKey].integerValue();
  entry.form = std::move(form);
  if (!keepsDuplicates()) {
    Identifier& identifier = identifiers_[plugIn.identifier()];
    identifier.all.entries.push_back(index);
    if (keepsAllVersions()) {
      identifier.byVersion[platform::withoutLeadingZeros(entry.version)].entries.push_back(index);
    }
  }
  const Value overridden = plugIn.entitlements()[XTOverrideEntitlement];
  if (overridden.isString()) overrides_[overridden.string()] = index;
  for (const Value& element : overridden.items()) {
    if (element.isString()) overrides_[element.string()] = index;
  }
}

platform::Array DiscoveryResults::finish() {
  if (!overrides_.empty()) {
    for (Entry& entry : entries_) {
      const auto found = entry.removed ? overrides_.end() : overrides_.find(entry.form[XTIdentifierFormKey].string());
      if (found == overrides_.end()) continue;
      Dictionary& overrider = entries_[found->second].form;
      entry.form.set(XTOverriderFormKey, overrider[XTUUIDFormKey]);
      overrider.set(XTOverridingFormKey, entry.form[XTIdentifierFormKey]);
      XTLogOps().info("plug-in {} overrides {}", overrider[XTUUIDFormKey], entry.form[XTUUIDFormKey]);
    }
  }
  std::vector<Value> forms;
  forms.reserve(entries_.size());
  for (Entry& entry : entries_) {
    if (!entry.removed) forms.emplace_back(std::move(entry.form));
  }
  return platform::Array(std::move(forms));
}

}  // namespace extora
