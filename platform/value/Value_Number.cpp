// Numbers: reads by numeric value, and equality over all their kinds.
#include <cmath>
#include <limits>

#include "platform/value/Value.h"

namespace platform {
namespace {

constexpr double kTwo63 = 9223372036854775808.0;
constexpr double kTwo64 = 18446744073709551616.0;

}  // namespace

bool Value::booleanValue() const noexcept {
  switch (kind_) {
    case Kind::Boolean:
      return payload_.boolean;
    case Kind::Signed:
      return payload_.integer != 0;
    case Kind::Unsigned:
      return payload_.natural != 0;
    case Kind::Real:
      return std::abs(payload_.real) >= 1;
    default:
      return false;
  }
}

std::int64_t Value::integerValue() const noexcept {
  switch (kind_) {
    case Kind::Boolean:
      return payload_.boolean ? 1 : 0;
    case Kind::Signed:
      return payload_.integer;
    case Kind::Unsigned:
      return payload_.natural <= std::uint64_t{std::numeric_limits<std::int64_t>::max()}
                 ? static_cast<std::int64_t>(payload_.natural)
                 : 0;
    case Kind::Real:
      return payload_.real >= -kTwo63 && payload_.real < kTwo63 ? static_cast<std::int64_t>(payload_.real) : 0;
    default:
      return 0;
  }
}

std::uint64_t Value::unsignedValue() const noexcept {
  switch (kind_) {
    case Kind::Boolean:
      return payload_.boolean ? 1 : 0;
    case Kind::Signed:
      return payload_.integer >= 0 ? static_cast<std::uint64_t>(payload_.integer) : 0;
    case Kind::Unsigned:
      return payload_.natural;
    case Kind::Real:
      return payload_.real >= 0 && payload_.real < kTwo64 ? static_cast<std::uint64_t>(payload_.real) : 0;
    default:
      return 0;
  }
}

double Value::realValue() const noexcept {
  switch (kind_) {
    case Kind::Boolean:
      return payload_.boolean ? 1 : 0;
    case Kind::Signed:
      return static_cast<double>(payload_.integer);
    case Kind::Unsigned:
      return static_cast<double>(payload_.natural);
    case Kind::Real:
      return payload_.real;
    default:
      return 0;
  }
}

bool Value::equalNumbers(const Value& a, const Value& b) noexcept {
  if (a.kind_ == Kind::Real && b.kind_ == Kind::Real) return a.payload_.real == b.payload_.real;
  if (b.kind_ == Kind::Real) return equalNumbers(b, a);
  const bool negative = b.kind_ == Kind::Signed && b.payload_.integer < 0;
  if (a.kind_ == Kind::Real) {
    // Rounding the integer to a real would make neighbours equal, so the real is turned into an integer.
    const double real = a.payload_.real;
    if (std::trunc(real) != real) return false;
    if (negative) return real >= -kTwo63 && real < 0 && static_cast<std::int64_t>(real) == b.payload_.integer;
    return real >= 0 && real < kTwo64 && static_cast<std::uint64_t>(real) == b.unsignedValue();
  }
  const bool otherNegative = a.kind_ == Kind::Signed && a.payload_.integer < 0;
  if (negative != otherNegative) return false;
  return negative ? a.payload_.integer == b.payload_.integer : a.unsignedValue() == b.unsignedValue();
}

}  // namespace platform
