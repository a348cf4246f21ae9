// Platform: one of each of the services that the device's operating system would offer. A plain struct that is handed
// to the server at construction; tests replace any one of them.
#pragma once

#include <memory>

#include "platform/assertions/ProcessAssertions.h"
#include "platform/consent/ConsentService.h"
#include "platform/container/Containers.h"
#include "platform/files/Directories.h"
#include "platform/files/Files.h"
#include "platform/files/UniqueFd.h"
#include "platform/jobs/JobManager.h"
#include "platform/locale/Locale.h"
#include "platform/notify/Notifications.h"
#include "platform/preferences/Preferences.h"
#include "platform/registry/ApplicationRegistry.h"
#include "platform/sandbox/Sandbox.h"
#include "platform/signing/CodeSigning.h"

namespace platform {

struct Platform {
  Directories directories;
  std::shared_ptr<Files> files;
  std::shared_ptr<Containers> containers;
  std::shared_ptr<Locale> locale;
  std::shared_ptr<Notifications> notifications;
  std::shared_ptr<Preferences> preferences;
  std::shared_ptr<CodeSigning> signing;
  std::shared_ptr<Sandbox> sandbox;
  std::shared_ptr<ApplicationRegistry> registry;
  std::shared_ptr<JobManager> jobs;
  std::shared_ptr<ProcessAssertions> assertions;
  std::shared_ptr<ConsentService> consent;

  /// The lock of the state directory, held as long as any copy of this struct that make() gave.
  std::shared_ptr<const UniqueFd> stateLock;

  /// The Linux implementations for `directories`, on the main thread: takes the lock before anything else of the state
  /// is opened, makes the state and runtime directories, scans the bundle folders, watches the locale. Null and `error`
  /// when another process has the lock (code EWOULDBLOCK), or when a directory cannot be made or belongs to somebody
  /// else.
  static std::shared_ptr<Platform> make(const Directories& directories, Error* error);
};

}  // namespace platform
