#include "platform/registry/TypeRegistry.h"

#include <algorithm>

namespace platform {

TypeRegistry::Type TypeRegistry::intern(const std::string& identifier) {
  const auto [place, isNew] = types_.emplace(identifier, static_cast<Type>(parents_.size()));
  if (isNew) parents_.emplace_back();
  return place->second;
}

void TypeRegistry::declare(const Value& declarations) {
  for (const Value& declaration : declarations.items()) {
    const std::string& identifier = declaration["HXTypeIdentifier"].string();
    if (identifier.empty()) continue;
    const Type type = intern(identifier);
    const Value& parents = declaration["HXTypeConformsTo"];
    if (parents.isString()) {
      const Type parent = intern(parents.string());
      parents_[type].push_back(parent);
    }
    for (const Value& each : parents.items()) {
      if (!each.isString()) continue;
      const Type parent = intern(each.string());
      parents_[type].push_back(parent);
    }
  }
}

template <typename Visit>
bool TypeRegistry::anyAncestor(Type type, const Visit& visit) const {
  std::vector<bool> met(parents_.size());
  std::vector<Type> waiting{type};
  met[type] = true;
  while (!waiting.empty()) {
    const Type next = waiting.back();
    waiting.pop_back();
    if (visit(next)) return true;
    for (const Type parent : parents_[next]) {
      if (met[parent]) continue;
      met[parent] = true;
      waiting.push_back(parent);
    }
  }
  return false;
}

bool TypeRegistry::conformsTo(const std::string& type, const std::string& other) const {
  if (type == other) return true;
  const auto from = types_.find(type);
  const auto to = types_.find(other);
  if (from == types_.end() || to == types_.end()) return false;
  return anyAncestor(from->second, [&](Type each) { return each == to->second; });
}

bool TypeRegistry::evaluateActivationRule(const Value& rule, const Value& items) const {
  if (rule.isNumber()) return rule == Value(true);
  const auto named = rule.entries();
  const auto all = items["items"].items();
  if (named.empty() || all.empty()) return false;
  if (!std::all_of(named.begin(), named.end(), [](const Value::Entry& each) { return each.value.isNumber(); })) {
    return false;
  }

  // Named types that have a number here are reached through their descendants too; the others only by their own name.
  std::unordered_map<Type, std::size_t> namedTypes;
  std::unordered_map<std::string_view, std::size_t> namedStrings;
  for (std::size_t i = 0; i < named.size(); ++i) {
    namedStrings.emplace(named[i].key, i);
    const auto known = types_.find(named[i].key);
    if (known != types_.end()) namedTypes.emplace(known->second, i);
  }
  // Items of a request may name one type a million times: what it conforms to is found once.
  std::unordered_map<std::string_view, std::vector<std::size_t>> conforming;
  const auto conformingTo = [&](const std::string& type) -> const std::vector<std::size_t>& {
    const auto [place, isNew] = conforming.try_emplace(type);
    std::vector<std::size_t>& found = place->second;
    if (!isNew) return found;
    if (const auto known = types_.find(type); known != types_.end()) {
      anyAncestor(known->second, [&](Type each) {
        if (const auto name = namedTypes.find(each); name != namedTypes.end()) found.push_back(name->second);
        return false;
      });
    } else if (const auto name = namedStrings.find(type); name != namedStrings.end()) {
      found.push_back(name->second);
    }
    return found;
  };

  std::vector<std::size_t> counts(named.size());
  std::vector<std::size_t> countedFor(named.size());  // the item, from 1, that a named type was counted for last
  for (std::size_t item = 1; item <= all.size(); ++item) {
    bool conforms = false;
    for (const Value& type : all[item - 1]["types"].items()) {
      if (!type.isString()) continue;
      for (const std::size_t name : conformingTo(type.string())) {
        conforms = true;
        if (countedFor[name] == item) continue;
        countedFor[name] = item;
        ++counts[name];
      }
    }
    if (!conforms) return false;
  }
  for (std::size_t i = 0; i < named.size(); ++i) {
    if (static_cast<double>(counts[i]) > named[i].value.realValue()) return false;
  }
  return true;
}

}  // namespace platform
