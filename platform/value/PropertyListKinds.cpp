#include "platform/value/PropertyListKinds.h"

#include <cmath>
#include <limits>

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

}  // namespace

Value convertLeaves(const Value& value, const std::function<Value(const Value& leaf)>& convert) {
  if (value.isArray()) {
    Array result(value);
    std::size_t at = 0;
    for (const Value& item : value.items()) {
      Value converted = convertLeaves(item, convert);
      if (converted.isNothing()) {
        result.removeAt(at);
        continue;
      }
      if (!converted.identicalTo(item)) result.set(at, std::move(converted));
      ++at;
    }
    return result;
  }
  if (value.isDictionary()) {
    Dictionary result(value);
    for (const auto& [key, item] : value.entries()) {
      Value converted = convertLeaves(item, convert);
      if (!converted.identicalTo(item)) result.set(key, std::move(converted));
    }
    return result;
  }
  return convert(value);
}

Value toPropertyListKinds(const Value& value) {
  return convertLeaves(value, convertLeaf);
}

}  // namespace platform
