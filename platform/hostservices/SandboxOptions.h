// The options with which bubblewrap makes a plug-in's sandbox. A pure function but for a look at which of the system's
// library folders there are.
#pragma once

#include <string>

#include "platform/hostservices/LaunchProfile.h"
#include "platform/jobs/JobManager.h"

namespace platform {

/// Each option ended by a NUL. The sandbox has user, process-id, IPC and (unless the profile grants it) network
/// namespaces of its own and no further user namespaces, no capabilities, a session of its own; the system's libraries,
/// the bundle and `socket` (the platform service's) read-only, the data container writable, /proc, /dev and a /tmp of
/// its own, and what the profile grants. It ends with the process that started bubblewrap.
std::string sandboxOptions(const JobManager::Launch& launch, const LaunchProfile& profile, const std::string& socket);

}  // namespace platform
