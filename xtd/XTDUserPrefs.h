// XTDUserPrefs: the user's preferences: the global exclusions. Callable from any thread.
#pragma once

#include <memory>

#include "platform/preferences/Preferences.h"
#include "platform/value/Value.h"

namespace extora {

class XTDUserPrefs {
 public:
  explicit XTDUserPrefs(std::shared_ptr<platform::Preferences> preferences);
  /// The value of "exclusions" in the domain "com.orvane.extora.userprefs", read fresh on every call; nothing when
  /// there is none. Normally an array of rules dictionaries.
  platform::Value exclusions() const;

 private:
  std::shared_ptr<platform::Preferences> preferences_;
};

}  // namespace extora
