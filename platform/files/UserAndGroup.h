// Users by name or number. For any thread; asks the user database.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

namespace platform {

struct UserAndGroup {
  uid_t user = 0;
  gid_t group = 0;

  /// The user of that name or number and its group; a number needs no entry in the user database (its group is then of
  /// the same number). Nothing for a name that nobody has.
  static std::optional<UserAndGroup> named(const std::string& name);
};

}  // namespace platform
