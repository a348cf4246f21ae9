// Small utilities over the system's collection types.
#pragma once

#include <compare>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value/NumericOrder.h"
#include "platform/value/Value.h"

namespace extora {

using platform::Array;
using platform::Dictionary;
using platform::Value;

/// Version comparison in the numeric string order: 1.9 orders before 1.10, 1.0 before 1.0.1, 1.0a before 1.0b.
std::weak_ordering compareVersionString(std::string_view receiver, std::string_view other) noexcept;

/// A new dictionary equal to `receiver` with `key` set to `value`; the nothing value removes the key.
Dictionary dictionaryChanging(const Dictionary& receiver, std::string_view key, const Value& value);

/// The values that `block` returns for the elements of `values`, in their order, leaving out those that are nothing.
template <typename Collection, typename Block>
Array arrayWithValues(const Collection& values, Block&& block) {
  Array result;
  for (const auto& element : values) {
    if (Value value = block(element); !value.isNothing()) result.append(std::move(value));
  }
  return result;
}

}  // namespace extora
