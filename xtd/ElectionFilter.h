// ElectionFilter: which elections a discovery query lets through, so that the registry's answer is narrow from the
// start (every rule is tested again on the plug-in itself). Immutable; for any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/value/Value.h"

namespace extora {

class ElectionFilter {
 public:
  /// The filter of a query's "HXUserElection": a string or an array of strings, each a value or "=" and a value.
  /// Nothing, and so no filtering, when it is absent or anything else, or when any of its elements is.
  static std::optional<ElectionFilter> fromQuery(const platform::Value& query);

  /// Whether the low 8 bits of an election, in decimal, are among the values. `election` is what an annotation holds;
  /// of a plug-in without one, its effective election.
  bool accepts(const platform::Value& election) const;

 private:
  explicit ElectionFilter(std::vector<std::string> values) : values_(std::move(values)) {}
  std::vector<std::string> values_;
};

/// The number that a stored election is, as 64 bits (a negative one in two's complement); 0 for what is no number.
std::uint64_t electionBits(const platform::Value& election) noexcept;

/// The same number in decimal, with its sign; "0" for what is no number.
std::string electionText(const platform::Value& election);

}  // namespace extora
