// PlatformBundle: the platform's view of a bundle, a directory with an Info.plist. Its place is fixed when it is made;
// the Info.plist is read on the first question and remembered until dropCaches(). Safe for use by several threads.
//
// It says what a bundle claims about itself; whether its claims count is a question for CodeSigning.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace platform {

class PlatformBundle {
 public:
  enum class PathKind { Bundle = 1, Executable = 2 };
  enum class Property { BundlePath = 2, ExecutablePath = 3, SupportPath = 9 };

  /// The bundle at `path` (kind Bundle: a directory, which need not hold an Info.plist yet), or the nearest directory
  /// above the executable `path` that holds an Info.plist (kind Executable). Never null: a path that is in no bundle
  /// gives an object that knows no properties.
  static std::shared_ptr<PlatformBundle> create(const std::string& path, PathKind kind);
  /// The bundle of the running process.
  static std::shared_ptr<PlatformBundle> main();

  /// The property, or nothing. The support directory is the bundle itself. The executable path is
  /// <bundle>/<HBBundleExecutable>, nothing without that key or when it resolves to a place that is not below the
  /// bundle; the file itself may be missing.
  std::optional<std::string> property(Property property) const;
  /// The Info.plist as a dictionary; the nothing value when there is none or it cannot be read.
  Value info() const;
  /// Forgets what was read, so that the next question reads it fresh.
  void dropCaches();
  /// "<bundle path>" or "<no bundle at PATH>".
  std::string describe() const;

 private:
  PlatformBundle(std::string askedPath, std::string bundlePath);
  std::optional<std::string> executablePath() const;

  const std::string askedPath_;
  const std::string bundlePath_;  // empty: knows no properties
  mutable Mutex mutex_;
  mutable std::optional<Value> info_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
