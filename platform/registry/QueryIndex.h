// QueryIndex: finds the records of one snapshot that may satisfy a query, at a cost that follows the size of the
// answer.
//
// For a rule key with an equality pattern it keeps an index from value to records, made when the key is asked for
// first; of more than kQueryIndexKeys keys the least used one is dropped. It only narrows: a record that the rules
// would accept is never left out. Safe for use by several threads.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/queue/Mutex.h"
#include "platform/registry/Records.h"

namespace platform {

inline constexpr std::size_t kQueryIndexKeys = 32;

class QueryIndex {
 public:
  /// `records` must outlive the index and not change.
  explicit QueryIndex(const PlugInRecords& records) : records_(records) {}

  /// The positions of the candidates for `query`, ascending; nothing when no rule of it narrows.
  std::optional<std::vector<std::uint32_t>> candidates(const Value& query) const;

  /// Number of keys that have an index now.
  std::size_t keyCount() const;
  bool hasKey(const std::string& key) const;

 private:
  using Positions = std::vector<std::uint32_t>;
  // Value, without the leading zeros of its digit runs, to the records that have it, ascending.
  using Postings = std::unordered_map<std::string, Positions>;
  struct Key {
    std::shared_ptr<const Postings> postings;
    std::uint64_t uses = 0;
  };

  std::shared_ptr<const Postings> postingsFor(const std::string& key) const;
  Postings makePostings(const std::string& key) const;

  const PlugInRecords& records_;
  mutable Mutex mutex_;
  mutable std::unordered_map<std::string, Key> keys_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
