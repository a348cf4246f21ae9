// Array: the writable handle of an array value. Copies share their node; the first write to a shared one clones it.
// Not safe for use by two threads at once; the values made from it are.
#pragma once

#include <initializer_list>

#include "platform/value/Value.h"

namespace platform {

class Array {
 public:
  Array() = default;
  Array(std::initializer_list<Value> items);
  explicit Array(std::vector<Value> items);
  /// The elements of `value` when it is an array, else empty: the "mutable copy" of an array value.
  explicit Array(const Value& value);

  std::size_t size() const noexcept { return value_.size(); }
  bool empty() const noexcept { return size() == 0; }
  std::span<const Value> items() const noexcept { return value_.items(); }
  const Value& operator[](std::size_t index) const noexcept { return value_.at(index); }
  auto begin() const noexcept { return items().begin(); }
  auto end() const noexcept { return items().end(); }

  void reserve(std::size_t capacity);
  void append(Value value);
  /// `index` lies inside the array; otherwise a broken contract.
  void set(std::size_t index, Value value);

  friend bool operator==(const Array& a, const Array& b) noexcept {
    return a.size() == b.size() && (a.empty() || a.value_ == b.value_);
  }

 private:
  friend class Value;
  std::vector<Value>& writable();
  Value value_;  // an array value, or nothing while empty
};

}  // namespace platform
