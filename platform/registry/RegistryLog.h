// RegistryLog: where the registry's own lines go.
#pragma once

#include "platform/log/Log.h"

namespace platform {

/// The category of dealings with the application registry.
inline const Log& registryLog() {
  static const Log* const log = Log::named("com.orvane.Extora", "ar");
  return log != nullptr ? *log : Log::processDefault();
}

}  // namespace platform
