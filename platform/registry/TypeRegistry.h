// TypeRegistry: the type identifiers that applications declare and what they conform to. Immutable once shared, for any
// thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/value/Value.h"

namespace platform {

class TypeRegistry {
 public:
  /// Adds the declarations of one application: an array of {"HXTypeIdentifier": text, "HXTypeConformsTo": text or array
  /// of texts}. What is malformed is left out; a type that several applications declare conforms to all that they say.
  void declare(const Value& declarations);

  /// True when `type` is `other` or is declared, directly or through its ancestors, to conform to it. A type that
  /// nobody declared conforms to itself alone.
  bool conformsTo(const std::string& type, const std::string& other) const;

  /// Whether an activation rule accepts the items {"items": [{"types": [identifier, ...]}, ...]}. True accepts any
  /// items; a dictionary {type identifier: maximum count} accepts when there is an item, every item conforms to one of
  /// the named types, and no named type is met more often than its maximum; anything else accepts nothing.
  bool evaluateActivationRule(const Value& rule, const Value& items) const;

 private:
  using Type = std::uint32_t;
  Type intern(const std::string& identifier);
  // Calls `visit` for every type that `type` conforms to, itself first, until it answers true; answers whether it did.
  template <typename Visit>
  bool anyAncestor(Type type, const Visit& visit) const;

  std::unordered_map<std::string, Type> types_;
  std::vector<std::vector<Type>> parents_;  // by type
};

}  // namespace platform
