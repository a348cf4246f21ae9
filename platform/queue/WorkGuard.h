// WorkGuard: the one way in which submitted work is run.
//
// An exception never crosses a queue: a broken contract that escapes from work (or from an event handler) is logged at
// fault with its text, the log is flushed, and the process aborts. Free functions without state, for any thread.
#pragma once

#include <exception>
#include <string_view>
#include <utility>

#include "platform/value/InternalInconsistency.h"

namespace platform {

/// Logs `text` at fault on the process's default log and aborts.
[[noreturn]] void abortWithFault(std::string_view text);

/// Runs `work`; what it throws ends the process.
template <typename Work>
void runGuarded(Work&& work) {
  try {
    std::forward<Work>(work)();
  } catch (const std::exception& exception) {
    abortWithFault(exception.what());
  } catch (...) {
    abortWithFault("unknown exception in queued work");
  }
}

}  // namespace platform
