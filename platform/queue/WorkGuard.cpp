#include "platform/queue/WorkGuard.h"

#include <cstdlib>

#include "platform/log/Log.h"

namespace platform {

void abortWithFault(std::string_view text) {
  Log::processDefault().fault("{}", text);
  Log::flush();
  std::abort();
}

}  // namespace platform
