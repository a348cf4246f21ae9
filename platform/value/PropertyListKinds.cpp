#include "platform/value/PropertyListKinds.h"

#include <cmath>
#include <limits>

#include "platform/value/DateText.h"

namespace platform {
namespace {

Value convertArray(const Value& value) {
  Array result(value);
  std::size_t at = 0;
  for (const Value& item : value.items()) {
    Value converted = toPropertyListKinds(item);
    if (converted.isNothing()) {
      result.removeAt(at);
      continue;
    }
    if (!converted.identicalTo(item)) result.set(at, std::move(converted));
    ++at;
  }
  return result;
}

Value convertDictionary(const Value& value) {
  Dictionary result(value);
  for (const auto& [key, item] : value.entries()) {
    Value converted = toPropertyListKinds(item);
    if (!converted.identicalTo(item)) result.set(key, std::move(converted));
  }
  return result;
}

}  // namespace

Value toPropertyListKinds(const Value& value) {
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
    case Kind::Array:
      return convertArray(value);
    case Kind::Dictionary:
      return convertDictionary(value);
    default:
      return value;
  }
}

}  // namespace platform
