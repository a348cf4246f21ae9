// DiscoveryResults: what one discovery has found so far: which of several forms of one identifier stays, and which
// plug-in overrides which. Forms keep the order in which they were accepted.
//
// Not safe for use by two threads at once: a discovery uses it on its post-export queue. The cost of one plug-in does
// not grow with the number of the others: forms are found by identifier and version, never by a walk over all of them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "Extora/XTPlugInCore.h"
#include "platform/value/Value.h"

namespace extora {

class DiscoveryResults {
 public:
  /// `flags`: those of the request; XTDiscoverAllVersions and XTDiscoverDuplicates count here.
  explicit DiscoveryResults(std::uint64_t flags) : flags_(flags) {}

  /// Whether `plugIn` is to be added, given the forms that are there. A form that has to make room for it is gone then.
  [[nodiscard]] bool admit(const XTPlugInCore& plugIn);
  /// Appends the finished form of an admitted plug-in, and notes which identifiers the plug-in overrides.
  void append(const XTPlugInCore& plugIn, Dictionary form);
  /// Links overriding and overridden forms (logged) and answers the forms in order. Once, at the end.
  [[nodiscard]] platform::Array finish();

 private:
  /// Of a form that was accepted; it stays here when it is removed, because it may override others all the same.
  struct Entry {
    Dictionary form;
    std::string version;
    bool systemResident = false;
    std::int64_t lastModified = 0;
    bool removed = false;
  };
  /// Indexes of entries in order. Those before `head` are removed ones.
  struct Line {
    std::vector<std::size_t> entries;
    std::size_t head = 0;
  };
  struct Identifier {
    Line all;
    /// Only with XTDiscoverAllVersions: by version, without the leading zeros of digit runs, so that versions that
    /// compare equal are equal.
    std::unordered_map<std::string, Line> byVersion;
  };

  Entry* first(Line& line);
  Entry* rivalOf(const XTPlugInCore& plugIn, Identifier& identifier);
  static bool isPreferred(const XTPlugInCore& plugIn, const Entry& entry);
  bool keepsAllVersions() const;
  bool keepsDuplicates() const;

  const std::uint64_t flags_;
  std::vector<Entry> entries_;
  std::unordered_map<std::string, Identifier> identifiers_;
  std::unordered_map<std::string, std::size_t> overrides_;  // identifier -> entry of the form that overrides it
};

}  // namespace extora
