#include "tools/OfferedPlugIns.h"

#include <fmt/format.h>

#include <utility>

#include "Extora/XTVocabulary.h"
#include "platform/log/Log.h"
#include "tools/PlugInText.h"

namespace tools {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using Change = OfferedPlugIns::Change;
using Kind = Change::Kind;

namespace {

Value withoutTokens(const Value& form) {
  Dictionary kept(form);
  kept.remove(extora::XTExtensionsFormKey);
  kept.remove(extora::XTServiceExtensionFormKey);
  return kept;
}

std::vector<std::string> differingKeys(const Value& a, const Value& b) {
  std::set<std::string> keys;
  for (const Value* form : {&a, &b}) {
    for (const auto& entry : form->entries()) {
      if (a[entry.key] != b[entry.key]) keys.insert(entry.key);
    }
  }
  return {keys.begin(), keys.end()};
}

const char* nameOf(Kind kind) {
  switch (kind) {
    case Kind::Installed:
      return "installed";
    case Kind::Offered:
      return "offered";
    case Kind::Changed:
      return "changed";
    case Kind::Withdrawn:
      return "withdrawn";
    case Kind::Removed:
      break;
  }
  return "removed";
}

}  // namespace

std::vector<Change> OfferedPlugIns::update(const std::vector<Value>& forms, const Exists& exists) {
  std::map<std::string, Value> current;
  for (const Value& form : forms) current.emplace(form[extora::XTUUIDFormKey].string(), withoutTokens(form));
  auto before = std::exchange(forms_, current);
  const auto known = known_;
  for (const auto& [uuid, form] : current) known_.insert(uuid);
  std::vector<Change> changes;
  if (!std::exchange(looked_, true)) return changes;

  std::vector<Value> gone;
  for (const auto& [uuid, form] : before) {
    if (current.count(uuid) == 0) gone.push_back(form);
  }
  for (const Value& form : sortedForms(Array(gone))) {
    const bool there = exists(form[extora::XTUUIDFormKey].string());
    changes.push_back({there ? Kind::Withdrawn : Kind::Removed, form, {}, {}});
  }
  for (const Value& sorted : sortedForms(Array(forms))) {
    const Value form = withoutTokens(sorted);
    const auto old = before.find(form[extora::XTUUIDFormKey].string());
    if (old == before.end()) {
      const bool isNew = form[extora::XTLastModifiedFormKey].integerValue() >= begun_ &&
                         known.count(form[extora::XTUUIDFormKey].string()) == 0;
      changes.push_back({isNew ? Kind::Installed : Kind::Offered, form, {}, {}});
    } else if (auto keys = differingKeys(old->second, form); !keys.empty()) {
      changes.push_back({Kind::Changed, form, std::move(keys), old->second});
    }
  }
  return changes;
}

std::string changeLine(const Change& change) {
  const Value& form = change.form;
  std::string line = fmt::format("{:<9}  {} {}  {}  {}", nameOf(change.kind),
                                 form[extora::XTIdentifierFormKey].string(), form[extora::XTVersionFormKey].string(),
                                 form[extora::XTUUIDFormKey].string(), form[extora::XTPathFormKey].string());
  for (const std::string& key : change.keys) {
    line += fmt::format("  {}: {} -> {}", key, change.before[key], form[key]);
  }
  return platform::escapeControlCharacters(line);
}

Dictionary changeRecord(const Change& change) {
  Dictionary record{{"change", nameOf(change.kind)}};
  for (const auto key : {extora::XTUUIDFormKey, extora::XTIdentifierFormKey, extora::XTVersionFormKey,
                         extora::XTPathFormKey, extora::XTAnnotationsFormKey}) {
    record.set(key, change.form[key]);
  }
  if (change.kind == Kind::Changed) {
    Array keys;
    for (const std::string& key : change.keys) keys.append(key);
    record.set("keys", std::move(keys));
  }
  return record;
}

}  // namespace tools
