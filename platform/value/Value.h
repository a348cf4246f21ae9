// Value: one immutable property-list and wire value.
//
// A value is 16 bytes, cheap to copy (reference-counted nodes) and safe to share among threads: a node is never written
// while somebody else refers to it. Array and Dictionary are the writable handles; they clone their node on the first
// write when it is shared. Reading the wrong kind, or a missing key at any level, answers nothing / false / 0 / empty
// and never throws.
#pragma once

#include <concepts>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/value/Uuid.h"

namespace platform {

class Array;
class Dictionary;
class UniqueFd;
struct ValueAccess;

using Bytes = std::vector<std::uint8_t>;

/// A moment: whole seconds since 1970-01-01T00:00:00Z (may be negative) and nanoseconds after them (0 to 999,999,999).
struct Date {
  std::int64_t seconds = 0;
  std::uint32_t nanoseconds = 0;
  friend auto operator<=>(const Date&, const Date&) = default;
};

enum class Kind : std::uint8_t {
  Nothing,
  Boolean,
  Signed,
  Unsigned,
  Real,
  Date,
  String,
  Data,
  Uuid,
  Array,
  Dictionary,
  Message,     ///< the encoded bytes of one property-list value, opaque until somebody opens it
  Descriptor,  ///< an owned file descriptor; travels only between a process and the platform's own services
};

class Value {
 public:
  struct Entry;

  Value() noexcept = default;
  template <std::same_as<bool> T>
  Value(T v) noexcept : kind_(Kind::Boolean) {  // NOLINT(google-explicit-constructor)
    payload_.boolean = v;
  }
  template <std::signed_integral T>
  Value(T v) noexcept : kind_(Kind::Signed) {  // NOLINT(google-explicit-constructor)
    payload_.integer = v;
  }
  template <std::unsigned_integral T>
  requires(!std::same_as<T, bool>) Value(T v)
  noexcept : kind_(Kind::Unsigned) {  // NOLINT(google-explicit-constructor)
    payload_.natural = v;
  }
  template <std::floating_point T>
  Value(T v) noexcept : kind_(Kind::Real) {  // NOLINT(google-explicit-constructor)
    payload_.real = static_cast<double>(v);
  }
  Value(Date date) noexcept;               // NOLINT(google-explicit-constructor)
  Value(const char* text);                 // NOLINT(google-explicit-constructor)
  Value(std::string_view text);            // NOLINT(google-explicit-constructor)
  Value(std::string text);                 // NOLINT(google-explicit-constructor)
  Value(const platform::Uuid& uuid);       // NOLINT(google-explicit-constructor)
  Value(platform::Array array);            // NOLINT(google-explicit-constructor)
  Value(platform::Dictionary dictionary);  // NOLINT(google-explicit-constructor)
  static Value data(Bytes bytes);
  static Value message(Bytes encoded);
  static Value descriptor(UniqueFd fd);

  Value(const Value& other) noexcept;
  Value(Value&& other) noexcept : kind_(other.kind_), nanoseconds_(other.nanoseconds_), payload_(other.payload_) {
    other.kind_ = Kind::Nothing;
  }
  Value& operator=(const Value& other) noexcept;
  Value& operator=(Value&& other) noexcept {
    Value old(std::move(*this));
    kind_ = std::exchange(other.kind_, Kind::Nothing);
    nanoseconds_ = other.nanoseconds_;
    payload_ = other.payload_;
    return *this;
  }
  ~Value() {
    if (hasNode()) release();
  }

  Kind kind() const noexcept { return kind_; }
  bool isNothing() const noexcept { return kind_ == Kind::Nothing; }
  explicit operator bool() const noexcept { return !isNothing(); }
  bool isBoolean() const noexcept { return kind_ == Kind::Boolean; }
  /// A boolean is a number wherever the system says number.
  bool isNumber() const noexcept { return kind_ >= Kind::Boolean && kind_ <= Kind::Real; }
  bool isString() const noexcept { return kind_ == Kind::String; }
  bool isData() const noexcept { return kind_ == Kind::Data; }
  bool isDate() const noexcept { return kind_ == Kind::Date; }
  bool isUuid() const noexcept { return kind_ == Kind::Uuid; }
  bool isArray() const noexcept { return kind_ == Kind::Array; }
  bool isDictionary() const noexcept { return kind_ == Kind::Dictionary; }
  bool isMessage() const noexcept { return kind_ == Kind::Message; }
  bool isDescriptor() const noexcept { return kind_ == Kind::Descriptor; }

  // Reads by exact kind, for wire keys: another kind reads as absent (false, 0).
  bool exactBoolean() const noexcept { return kind_ == Kind::Boolean && payload_.boolean; }
  std::uint64_t exactUnsigned() const noexcept { return kind_ == Kind::Unsigned ? payload_.natural : 0; }
  std::int64_t exactSigned() const noexcept { return kind_ == Kind::Signed ? payload_.integer : 0; }

  // Reads by numeric value, for metadata, annotations and forms: any number or boolean; a real is truncated; out of
  // range and not a number are 0. booleanValue is true for every number that is not 0 when truncated.
  bool booleanValue() const noexcept;
  std::int64_t integerValue() const noexcept;
  std::uint64_t unsignedValue() const noexcept;
  double realValue() const noexcept;

  /// The text; empty for another kind. Valid as long as this value.
  const std::string& string() const noexcept;
  /// The bytes of a data or message value; empty for another kind.
  const Bytes& bytes() const noexcept;
  /// The UUID; the nil UUID for another kind.
  const platform::Uuid& uuid() const noexcept;
  Date date() const noexcept;
  /// The descriptor, still owned by the value; -1 for another kind.
  int descriptor() const noexcept;

  /// The elements of an array; empty for another kind.
  std::span<const Value> items() const noexcept;
  /// The entries of a dictionary, sorted by key (by code point); empty for another kind.
  std::span<const Entry> entries() const noexcept;
  /// Number of elements or entries; 0 for another kind.
  std::size_t size() const noexcept;
  /// The value under `key` of a dictionary; the nothing value when absent or for another kind.
  const Value& operator[](std::string_view key) const noexcept;
  /// The element at `index` of an array; the nothing value when out of range or for another kind.
  const Value& at(std::size_t index) const noexcept;

  /// Numbers and booleans are equal by numeric value, exactly (no rounding on the way); everything else by kind and
  /// content.
  friend bool operator==(const Value& a, const Value& b) noexcept;

  /// One line for logs, probes and error texts: a string stands plainly at the top level and quoted inside collections,
  /// nothing is "(null)". A text longer than 64 KiB is cut and ends in "...".
  std::string describe() const;

  /// True when both values are the very same node (or equal scalars): a cheap test for "unchanged".
  bool identicalTo(const Value& other) const noexcept;

  struct Node;

 private:
  friend class platform::Array;
  friend class platform::Dictionary;
  friend struct ValueAccess;
  Value(Kind kind, Node* node) noexcept;
  void release() noexcept;
  void appendDescription(std::string& out, bool quoted) const;
  static bool equalNumbers(const Value& a, const Value& b) noexcept;
  bool hasNode() const noexcept { return kind_ >= Kind::String; }

  Kind kind_ = Kind::Nothing;
  std::uint32_t nanoseconds_ = 0;
  union {
    bool boolean;
    std::int64_t integer;
    std::uint64_t natural;
    double real;
    Node* node;
  } payload_ = {.natural = 0};
};

static_assert(sizeof(Value) == 16);

struct Value::Entry {
  std::string key;
  Value value;
  friend bool operator==(const Entry&, const Entry&) noexcept = default;
};

}  // namespace platform

#include "platform/value/Array.h"       // IWYU pragma: export
#include "platform/value/Dictionary.h"  // IWYU pragma: export
