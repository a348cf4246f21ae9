// The reference-counted nodes behind Value: for the sources of the value room and the parsers that build values.
//
// A node is written only while exactly one value refers to it; that is why no lock is needed.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/value/Value.h"

namespace platform {

struct Value::Node {
  std::atomic<std::uint32_t> references{1};
};

struct StringNode : Value::Node {
  explicit StringNode(std::string&& t) noexcept : text(std::move(t)) {}
  explicit StringNode(std::string_view t) : text(t) {}
  std::string text;
};

/// Data and messages.
struct BytesNode : Value::Node {
  explicit BytesNode(Bytes&& b) noexcept : bytes(std::move(b)) {}
  Bytes bytes;
};

struct UuidNode : Value::Node {
  explicit UuidNode(const platform::Uuid& u) noexcept : uuid(u) {}
  platform::Uuid uuid;
};

struct ArrayNode : Value::Node {
  ArrayNode() = default;
  explicit ArrayNode(std::vector<Value>&& i) noexcept : items(std::move(i)) {}
  std::vector<Value> items;
};

struct DictionaryNode : Value::Node {
  DictionaryNode() = default;
  explicit DictionaryNode(std::vector<Value::Entry>&& e) noexcept : entries(std::move(e)) {}
  std::vector<Value::Entry> entries;  // keys strictly ascending, no value nothing
};

struct DescriptorNode : Value::Node {
  explicit DescriptorNode(UniqueFd f) noexcept : fd(std::move(f)) {}
  UniqueFd fd;
};

/// Makes values from finished parts without looking at them again.
struct ValueAccess {
  static Value array(std::vector<Value>&& items) { return {Kind::Array, new ArrayNode(std::move(items))}; }
  /// `entries` hold strictly ascending keys and no value nothing.
  static Value dictionary(std::vector<Value::Entry>&& entries) {
    return {Kind::Dictionary, new DictionaryNode(std::move(entries))};
  }
};

/// True when the keys ascend strictly.
inline bool isSorted(const std::vector<Value::Entry>& entries) noexcept {
  for (std::size_t i = 1; i < entries.size(); ++i) {
    if (entries[i - 1].key >= entries[i].key) return false;
  }
  return true;
}

/// Sorts `entries` by key; of equal keys the last one stays. True when there were equal keys.
bool sortEntries(std::vector<Value::Entry>& entries);

}  // namespace platform
