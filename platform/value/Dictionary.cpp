#include "platform/value/Dictionary.h"

#include <algorithm>
#include <iterator>

#include "platform/value/ValueNodes.h"

namespace platform {
namespace {

std::vector<Value::Entry> entriesOf(std::initializer_list<std::pair<std::string_view, Value>> pairs) {
  std::vector<Value::Entry> entries;
  entries.reserve(pairs.size());
  for (const auto& [key, value] : pairs) entries.push_back({std::string(key), value});
  return entries;
}

bool keyBefore(const Value::Entry& entry, std::string_view key) noexcept {
  return entry.key < key;
}

}  // namespace

bool sortEntries(std::vector<Value::Entry>& entries) {
  std::stable_sort(entries.begin(), entries.end(),
                   [](const Value::Entry& a, const Value::Entry& b) { return a.key < b.key; });
  // From the back, so that the last of equal keys is the one that unique keeps.
  const auto kept = std::unique(entries.rbegin(), entries.rend(),
                                [](const Value::Entry& a, const Value::Entry& b) { return a.key == b.key; });
  const bool repeated = kept != entries.rend();
  entries.erase(entries.begin(), kept.base());
  return repeated;
}

Dictionary::Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries)
    : Dictionary(entriesOf(entries)) {}

Dictionary::Dictionary(std::vector<Value::Entry> entries) {
  if (!isSorted(entries)) (void)sortEntries(entries);
  std::erase_if(entries, [](const Value::Entry& entry) { return entry.value.isNothing(); });
  value_ = ValueAccess::dictionary(std::move(entries));
}

Dictionary::Dictionary(const Value& value) : value_(value.isDictionary() ? value : Value()) {}

std::vector<Value::Entry>& Dictionary::writable() {
  if (value_.isNothing()) {
    value_ = ValueAccess::dictionary({});
  } else if (value_.payload_.node->references.load(std::memory_order_acquire) != 1) {
    value_ = ValueAccess::dictionary(std::vector<Value::Entry>(entries().begin(), entries().end()));
  }
  return static_cast<DictionaryNode*>(value_.payload_.node)->entries;
}

void Dictionary::set(std::string_view key, Value value) {
  if (value.isNothing()) return remove(key);
  std::vector<Value::Entry>& all = writable();
  const auto place = std::lower_bound(all.begin(), all.end(), key, keyBefore);
  if (place != all.end() && place->key == key) {
    place->value = std::move(value);
  } else {
    all.insert(place, Value::Entry{std::string(key), std::move(value)});
  }
}

void Dictionary::remove(std::string_view key) {
  if (!contains(key)) return;
  std::vector<Value::Entry>& all = writable();
  all.erase(std::lower_bound(all.begin(), all.end(), key, keyBefore));
}

}  // namespace platform
