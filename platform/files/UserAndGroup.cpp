#include "platform/files/UserAndGroup.h"

#include <pwd.h>

#include <array>
#include <charconv>

namespace platform {

std::optional<UserAndGroup> UserAndGroup::named(const std::string& name) {
  uid_t number = 0;
  const auto [end, bad] = std::from_chars(name.data(), name.data() + name.size(), number);
  const bool numeric = bad == std::errc() && end == name.data() + name.size();
  std::array<char, 16384> buffer{};
  struct passwd entry {};
  struct passwd* found = nullptr;
  if (numeric) {
    (void)::getpwuid_r(number, &entry, buffer.data(), buffer.size(), &found);
  } else {
    (void)::getpwnam_r(name.c_str(), &entry, buffer.data(), buffer.size(), &found);
  }
  if (found != nullptr) return UserAndGroup{found->pw_uid, found->pw_gid};
  return numeric ? std::optional(UserAndGroup{number, number}) : std::nullopt;
}

}  // namespace platform
