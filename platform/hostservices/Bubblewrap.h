// Starting bubblewrap. A free function, for a thread that lives as long as the process: bubblewrap, and the sandbox
// with it, ends with the thread that started it.
#pragma once

#include <sys/types.h>

#include <optional>

#include "platform/files/UserAndGroup.h"

namespace platform {

struct BubblewrapStart {
  const char* program = nullptr;     ///< path of bubblewrap
  std::optional<UserAndGroup> user;  ///< whom to become first; nothing: this process's own
  // Descriptors of the caller's; see platform/launch/LaunchProtocol.h.
  int null = -1;
  int complaints = -1;
  int connection = -1;
  int control = -1;
  int plan = -1;
  int options = -1;
  int launchProgram = -1;
};

/// Starts bubblewrap with those descriptors and no others, an empty environment, default signals and an empty mask, in
/// a session of its own. Its process id; or -1 and an error number. That it could not be executed shows in its exit
/// status, 127. The caller reaps it.
[[nodiscard]] pid_t startBubblewrap(const BubblewrapStart& start, int* errorNumber);

}  // namespace platform
