// The keys that mean something in a bundle's property lists, and what can be wrong with keys alone: the wrong kind of
// value, the wrong place, or a spelling that is close to a right one.
#pragma once

#include <string>

#include "platform/value/Value.h"
#include "tools/Finding.h"

namespace tools {

/// Where a key stands.
enum class KeyPlace {
  Info,          ///< the Info.plist itself
  PlugIn,        ///< HXExtension
  Attributes,    ///< HXExtensionAttributes
  Entitlements,  ///< Entitlements.plist
};

/// Reports what is wrong with the keys of `dictionary`, which stands at `place` in `file`. An attribute, an entitlement
/// or a key of the Info.plist that is unknown and close to no known one is the author's own, and nothing to report.
void checkKeys(KeyPlace place, const platform::Value& dictionary, const std::string& file, const Report& report);

}  // namespace tools
