#include "xtd/XTDUserPrefs.h"

#include <string>
#include <utility>

#include "Extora/XTVocabulary.h"

namespace extora {

XTDUserPrefs::XTDUserPrefs(std::shared_ptr<platform::Preferences> preferences) : preferences_(std::move(preferences)) {}

platform::Value XTDUserPrefs::exclusions() const {
  return preferences_->preferenceValue(std::string(XTPreferenceDomain), std::string(XTExclusionsPreferenceKey));
}

}  // namespace extora
