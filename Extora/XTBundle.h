// XTBundle: a thin accessor over the platform's bundle object: paths, identifier, Info.plist of one bundle.
// Safe for use by several threads.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/bundle/PlatformBundle.h"
#include "platform/value/Url.h"
#include "platform/value/Value.h"

namespace extora {

class XTBundle {
 public:
  using Property = platform::PlatformBundle::Property;

  /// The process's own bundle.
  static std::shared_ptr<XTBundle> initForMainBundle();
  static std::shared_ptr<XTBundle> initWithURL(const platform::Url& url);
  static std::shared_ptr<XTBundle> initWithPath(const std::string& path);
  static std::shared_ptr<XTBundle> initWithExecutableURL(const platform::Url& url);
  /// The bundle that holds the executable; a path that lies in no bundle is treated as a bundle path.
  static std::shared_ptr<XTBundle> initWithExecutablePath(const std::string& path);
  /// The designated initializer.
  static std::shared_ptr<XTBundle> initWithIPCBundle(std::shared_ptr<platform::PlatformBundle> bundle);

  /// A property as a string, or nothing.
  std::optional<std::string> stringProperty(Property number) const;
  /// Nothing when the platform bundle knows no properties.
  std::optional<std::string> path() const;
  std::optional<platform::Url> url() const;
  /// The executable, else path().
  std::optional<std::string> executablePath() const;
  /// The support-files directory, computed on first use and kept; nothing when the platform has none.
  std::optional<std::string> supportPath() const;
  /// supportPath() with `name` appended as a path component; nothing without a support path.
  std::optional<std::string> bundleDirectory(const std::string& name) const;
  /// bundleDirectory("PlugIns").
  std::optional<std::string> plugInsPath() const;
  /// "HBBundleIdentifier" of the Info.plist, or nothing.
  std::optional<std::string> bundleIdentifier() const;
  /// The bundle's Info.plist, or the nothing value (logged at info level).
  platform::Value infoDictionary() const;
  std::string describe() const;

 private:
  explicit XTBundle(std::shared_ptr<platform::PlatformBundle> bundle);
  mutable platform::Mutex mutex_;
  mutable std::optional<std::string> supportPath_ XT_GUARDED_BY(mutex_);
  const std::shared_ptr<platform::PlatformBundle> bundle_;
};

}  // namespace extora
