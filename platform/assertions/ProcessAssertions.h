// ProcessAssertions: which running plug-in instances say that they are busy. Callable from any thread.
#pragma once

#include <memory>
#include <set>
#include <string>

#include "platform/jobs/JobManager.h"
#include "platform/value/Value.h"

namespace platform {

/// The key of a busy description and of an instance: its bundle identifier.
inline constexpr const char* kBusyBundleIdentifierKey = "HBBundleIdentifier";

class ProcessAssertions {
 public:
  virtual ~ProcessAssertions() = default;
  /// The busy instances of the given bundle identifiers, oldest first: an array of dictionaries that hold the bundle
  /// identifier and the process id ("pid").
  virtual Value queryBusyInstances(const std::set<std::string>& bundleIdentifiers) = 0;
  /// Over the job manager's instances.
  static std::shared_ptr<ProcessAssertions> make(std::shared_ptr<JobManager> jobs);
};

}  // namespace platform
