// The rules language: how a rule's key selects a value of the plug-in, and how a pattern is compared with it.
#include <string_view>

#include "Extora/XTLog.h"
#include "platform/value/NumericOrder.h"
#include "xtd/ElectionFilter.h"
#include "xtd/XTDPlugIn.h"
#include "xtd/XTDatabase.h"

namespace extora {
namespace {

constexpr std::string_view kEntitlementPrefix = "ENTITLEMENT:";
constexpr std::string_view kConformsOperator = "?KD-CONFORMS:";
constexpr std::string_view kIsOperator = "?KD-IS:";

struct Comparison {
  std::string_view prefix;
  bool (*accepts)(std::weak_ordering order);
};

// In the order in which the prefixes are tried.
constexpr Comparison kComparisons[] = {
    {"<>", [](std::weak_ordering order) { return order != 0; }},
    {"<=", [](std::weak_ordering order) { return order <= 0; }},
    {">=", [](std::weak_ordering order) { return order >= 0; }},
    {"=", [](std::weak_ordering order) { return order == 0; }},
    {"<", [](std::weak_ordering order) { return order < 0; }},
    {">", [](std::weak_ordering order) { return order > 0; }},
    {"", [](std::weak_ordering order) { return order == 0; }},
};

}  // namespace

bool XTDPlugIn::match(const Value& rules) const {
  if (!rules) return true;
  if (!rules.isDictionary()) return false;
  for (const auto& [key, pattern] : rules.entries()) {
    if (!matchKey(key, pattern)) return false;
  }
  return true;
}

Value XTDPlugIn::ruleValue(const std::string& key) const {
  Value value;
  if (key == XTIdentifierAttribute) {
    if (!identifier().empty()) value = identifier();
  } else if (key == XTUUIDAttribute) {
    value = uuid().text();
  } else if (key == XTUserElectionAttribute) {
    if (const std::shared_ptr<XTDatabase> database = database_.lock()) {
      value = electionText(database->annotationForPlugIn(*this)[XTAnnotationElectionKey]);
    }
  }
  if (!value) value = attribute(key);
  if (!value) value = infoKey(key);
  return value;
}

bool XTDPlugIn::matchKey(const std::string& key, const Value& pattern) const {
  Value value;
  if (key.starts_with(kEntitlementPrefix)) {
    value = valueForEntitlement(std::string_view(key).substr(kEntitlementPrefix.size()));
  } else if (key == XTContainingAppAttribute) {
    const std::optional<std::string> container = containingPath();
    if (!container) return false;  // whatever the pattern
    value = *container;
  } else {
    value = ruleValue(key);
  }
  const bool holds = value && value != Value(false);
  if (pattern == Value(true)) return holds;
  if (pattern == Value(false)) return !holds;
  if (!value) return false;
  if (pattern.isDictionary()) return matchDictionary(value, pattern);
  if (value.isString()) return matchValuePatterns(value, pattern);
  for (const Value& element : value.items()) {
    if (matchValuePatterns(element, pattern)) return true;
  }
  return false;
}

bool XTDPlugIn::matchValuePatterns(const Value& value, const Value& pattern) const {
  if (pattern.isString()) return matchValuePattern(value, pattern.string());
  for (const Value& alternative : pattern.items()) {
    if (alternative.isString() && matchValuePattern(value, alternative.string())) return true;
  }
  return false;
}

bool XTDPlugIn::matchValuePattern(const Value& value, const std::string& pattern) const {
  if (!value.isString()) return false;
  const std::string& text = value.string();
  if (pattern.starts_with(kConformsOperator)) {
    return registry_->typeConformsTo(text, pattern.substr(kConformsOperator.size()));
  }
  if (pattern.starts_with(kIsOperator)) return registry_->typeConformsTo(pattern.substr(kIsOperator.size()), text);
  if (pattern.starts_with('?')) {
    XTLogOps().info("unrecognized match operator:{}", pattern);
    return false;
  }
  for (const Comparison& comparison : kComparisons) {
    if (!pattern.starts_with(comparison.prefix)) continue;
    const std::string_view operand = std::string_view(pattern).substr(comparison.prefix.size());
    return comparison.accepts(platform::compareNumeric(text, operand));
  }
  return false;
}

bool XTDPlugIn::matchDictionary(const Value& value, const Value& pattern) const {
  XTLogExtension().debug("evaluating HXExtension filter: {} value: {}", pattern, value);
  return registry_->evaluateActivationRule(value, pattern);
}

}  // namespace extora
