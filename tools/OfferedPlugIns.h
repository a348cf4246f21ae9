// OfferedPlugIns: what a host is offered, from one look to the next, and what has changed in between.
//
// For one thread.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace tools {

class OfferedPlugIns {
 public:
  /// One difference between two looks.
  struct Change {
    enum class Kind {
      Installed,  ///< offered for the first time, and registered since the first look
      Offered,    ///< offered again, or for the first time though it was there before
      Changed,    ///< offered as before, but its form says something else
      Withdrawn,  ///< there, but not offered any more: held, excluded, in favour of another version...
      Removed,    ///< not there any more
    };
    Kind kind = Kind::Offered;
    platform::Value form;           ///< of a plug-in that is gone, its last one
    std::vector<std::string> keys;  ///< of the form's entries that differ, when Changed
    platform::Value before;         ///< the form of the look before, when Changed
  };
  /// Whether the daemon still knows the plug-in of this UUID.
  using Exists = std::function<bool(const std::string& uuid)>;

  /// `now`: seconds since the epoch, of the first look.
  explicit OfferedPlugIns(std::int64_t now) : begun_(now) {}

  /// Takes the next look: the forms of a match. What has gone comes first, then what has come or changed, each in order
  /// of identifier and version. The first look has no changes. Tokens, which are fresh each time, are no change.
  std::vector<Change> update(const std::vector<platform::Value>& forms, const Exists& exists);
  std::size_t size() const { return forms_.size(); }

 private:
  const std::int64_t begun_;
  bool looked_ = false;
  std::map<std::string, platform::Value> forms_;  // by UUID
  std::set<std::string> known_;                   // the UUIDs of all that was ever offered
};

/// The change as one line for people, without a line feed.
std::string changeLine(const OfferedPlugIns::Change& change);
/// The change for programs: "change", "uuid", "identifier", "version", "path", "annotations", and "keys" when Changed.
platform::Dictionary changeRecord(const OfferedPlugIns::Change& change);

}  // namespace tools
