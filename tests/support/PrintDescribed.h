// Lets GoogleTest print what describes itself (values, errors, UUIDs, URLs) in the messages of failed expectations.
#pragma once

#include <ostream>

#include "platform/value/Describe.h"

namespace platform {

template <Describable T>
void PrintTo(const T& object, std::ostream* out) {
  *out << object.describe();
}

}  // namespace platform
