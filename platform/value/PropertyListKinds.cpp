#include "platform/value/PropertyListKinds.h"

#include <cmath>
#include <limits>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include "platform/value/DateText.h"

namespace platform {
namespace {

Value convertLeaf(const Value& value) {
  switch (value.kind()) {
    case Kind::Uuid:
      return value.uuid().text();
    case Kind::Unsigned:
      if (value.exactUnsigned() > std::uint64_t{std::numeric_limits<std::int64_t>::max()}) return value;
      return static_cast<std::int64_t>(value.exactUnsigned());
    case Kind::Date:
      // A year that a property list cannot write would keep everything beside it from being saved.
      return dateText(value.date()) ? Value(Date{value.date().seconds, 0}) : Value();
    case Kind::Real:
      return std::isfinite(value.realValue()) ? value : Value();
    case Kind::Message:
    case Kind::Descriptor:
      return {};
    default:
      return value;
  }
}

const Value& valueOf(const Value& item) {
  return item;
}
const Value& valueOf(const Value::Entry& entry) {
  return entry.value;
}
Value withValue(const Value&, Value value) {
  return value;
}
Value::Entry withValue(const Value::Entry& entry, Value value) {
  return {entry.key, std::move(value)};
}

// What becomes of the elements; nothing while each stays as it is. They are collected, never removed one by one: what a
// sender chose must not take a time that grows with its square.
template <typename Element>
std::optional<std::vector<Element>> convertEach(std::span<const Element> elements,
                                                const std::function<Value(const Value& leaf)>& convert) {
  std::optional<std::vector<Element>> changed;
  for (std::size_t i = 0; i < elements.size(); ++i) {
    Value converted = convertLeaves(valueOf(elements[i]), convert);
    if (!changed) {
      if (converted && converted.identicalTo(valueOf(elements[i]))) continue;
      changed.emplace(elements.begin(), elements.begin() + static_cast<std::ptrdiff_t>(i));
      changed->reserve(elements.size());
    }
    if (!converted.isNothing()) changed->push_back(withValue(elements[i], std::move(converted)));
  }
  return changed;
}

}  // namespace

Value convertLeaves(const Value& value, const std::function<Value(const Value& leaf)>& convert) {
  if (value.isArray()) {
    auto changed = convertEach(value.items(), convert);
    return changed ? Value(Array(std::move(*changed))) : value;
  }
  if (value.isDictionary()) {
    auto changed = convertEach(value.entries(), convert);
    return changed ? Value(Dictionary(std::move(*changed))) : value;
  }
  return convert(value);
}

Value toPropertyListKinds(const Value& value) {
  return convertLeaves(value, convertLeaf);
}

}  // namespace platform
