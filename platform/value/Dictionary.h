// Dictionary: the writable handle of a dictionary value. Copies share their node; the first write to a shared one
// clones it. Entries are kept sorted by key, so that equal dictionaries have equal bytes. Not safe for use by two
// threads at once; the values made from it are.
#pragma once

#include <initializer_list>
#include <utility>

#include "platform/value/Value.h"

namespace platform {

class Dictionary {
 public:
  Dictionary() = default;
  /// Entries whose value is nothing are left out; of equal keys the last one counts.
  Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries);
  /// Takes entries that may be in any order; of equal keys the last one counts.
  explicit Dictionary(std::vector<Value::Entry> entries);
  /// The entries of `value` when it is a dictionary, else empty: the "mutable copy" of a dictionary value.
  explicit Dictionary(const Value& value);

  std::size_t size() const noexcept { return value_.size(); }
  bool empty() const noexcept { return size() == 0; }
  std::span<const Value::Entry> entries() const noexcept { return value_.entries(); }
  /// The value under `key`, or the nothing value.
  const Value& operator[](std::string_view key) const noexcept { return value_[key]; }
  bool contains(std::string_view key) const noexcept { return !value_[key].isNothing(); }
  auto begin() const noexcept { return entries().begin(); }
  auto end() const noexcept { return entries().end(); }

  /// Sets `key`; the nothing value removes it.
  void set(std::string_view key, Value value);
  void remove(std::string_view key);

  friend bool operator==(const Dictionary& a, const Dictionary& b) noexcept {
    return a.size() == b.size() && (a.empty() || a.value_ == b.value_);
  }

 private:
  friend class Value;
  std::vector<Value::Entry>& writable();
  Value value_;  // a dictionary value, or nothing while empty
};

}  // namespace platform
