// ValueBuilder: assembles one nested value from a parser's events. Every container is made once, at its end, with
// exactly the room that it needs, so that a claimed length takes no memory. For one thread; reusable after take() or
// clear(), which keep its working memory.
#pragma once

#include <iterator>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/value/ValueNodes.h"

namespace platform {

class ValueBuilder {
 public:
  /// Containers that are open.
  std::size_t depth() const noexcept { return open_.size(); }
  bool inDictionary() const noexcept { return !open_.empty() && open_.back().dictionary; }

  void beginArray() { open_.push_back({false, values_.size()}); }
  void beginDictionary() { open_.push_back({true, entries_.size()}); }
  /// The key of the value to come. Only inside a dictionary, and once before each value.
  void key(std::string_view text) { entries_.emplace_back(Value::Entry{std::string(text), Value()}); }

  /// A finished value: the element, the entry's value or, outside of all containers, the result.
  void add(Value&& value) {
    if (open_.empty()) {
      result_ = std::move(value);
    } else if (open_.back().dictionary) {
      entries_.back().value = std::move(value);
    } else {
      values_.push_back(std::move(value));
    }
  }

  void endArray() {
    const auto first = values_.begin() + static_cast<std::ptrdiff_t>(open_.back().first);
    std::vector<Value> items(std::make_move_iterator(first), std::make_move_iterator(values_.end()));
    values_.erase(first, values_.end());
    open_.pop_back();
    add(ValueAccess::array(std::move(items)));
  }

  /// False when a key stood twice; the last one counts then.
  bool endDictionary() {
    const auto first = entries_.begin() + static_cast<std::ptrdiff_t>(open_.back().first);
    std::vector<Value::Entry> entries(std::make_move_iterator(first), std::make_move_iterator(entries_.end()));
    entries_.erase(first, entries_.end());
    open_.pop_back();
    const bool unique = isSorted(entries) || !sortEntries(entries);
    add(ValueAccess::dictionary(std::move(entries)));
    return unique;
  }

  /// The result, or nothing when there is none yet.
  Value take() noexcept { return std::exchange(result_, Value()); }

  /// Drops what is there, and the working memory too when it has grown beyond the usual.
  void clear() noexcept {
    result_ = Value();
    open_.clear();
    values_.clear();
    entries_.clear();
    if (values_.capacity() > kKept) std::vector<Value>().swap(values_);
    if (entries_.capacity() > kKept) std::vector<Value::Entry>().swap(entries_);
  }

 private:
  static constexpr std::size_t kKept = 4096;
  struct Open {
    bool dictionary;
    std::size_t first;  // where its elements begin in values_ or entries_
  };
  std::vector<Open> open_;
  std::vector<Value> values_;          // elements of the open arrays, innermost last
  std::vector<Value::Entry> entries_;  // entries of the open dictionaries, innermost last
  Value result_;
};

}  // namespace platform
