// Values turned into what a receiver can hold, leaf by leaf. What a host sends to be kept or compared (annotations,
// rules, environment) is turned into property-list kinds on arrival, so that memory, file and a restart agree.
#pragma once

#include <functional>

#include "platform/value/Value.h"

namespace platform {

/// `value` with every leaf, at any depth, replaced by what `convert` makes of it; a leaf of which it makes nothing is
/// left out of its collection. A collection in which nothing changes comes back as it is, node and all.
Value convertLeaves(const Value& value, const std::function<Value(const Value& leaf)>& convert);

/// A UUID becomes its text, an unsigned number up to 2^63-1 signed, a date whole seconds; messages, descriptors and
/// reals that are not finite, and dates outside of the years 0 to 9999, are left out (nothing at the top level).
Value toPropertyListKinds(const Value& value);

}  // namespace platform
