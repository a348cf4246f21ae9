// What a host sends to be kept or compared (annotations, rules, environment) is turned into property-list kinds on
// arrival, so that memory, file and a restart agree.
#pragma once

#include "platform/value/Value.h"

namespace platform {

/// A UUID becomes its text, an unsigned number up to 2^63-1 signed, a date whole seconds; messages, descriptors and
/// reals that are not finite, and dates outside of the years 0 to 9999, are left out (nothing at the top level).
Value toPropertyListKinds(const Value& value);

}  // namespace platform
