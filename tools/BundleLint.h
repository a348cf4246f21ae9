// BundleLint: looks at application and plug-in bundles on disk as the daemon would, and reports everything that is
// wrong with them, and what may be. Needs no daemon. For one thread.
#pragma once

#include <map>
#include <string>
#include <utility>
#include <vector>

#include "Extora/XTExtensionPoints.h"
#include "platform/registry/BundleScanner.h"
#include "tools/Finding.h"
#include "tools/MetadataKeys.h"

namespace tools {

class BundleLint {
 public:
  /// `points` are the device's, and outlive this; `profiles` is the folder of its sandbox profiles.
  BundleLint(const extora::XTExtensionPoints& points, std::string profiles)
      : points_(points), profiles_(std::move(profiles)) {}

  /// Looks at the application (a name that ends in .app) or plug-in at the absolute path.
  void check(const std::string& path);

  const std::vector<Finding>& findings() const { return findings_; }
  /// Path and Info.plist of each plug-in that was looked at.
  const std::vector<std::pair<std::string, platform::Value>>& plugIns() const { return plugIns_; }

 private:
  using Severity = Finding::Severity;
  void add(Severity severity, std::string file, std::string_view key, std::string problem, std::string advice);
  void addScanProblems(const std::vector<platform::ScanProblem>& problems);

  void checkApplication(const std::string& path);
  void checkWhatIsNoPlugIn(const std::string& folder, const platform::ScannedGroup& group);
  void checkPlugIn(const platform::BundleRegistration& plugIn, const std::string& application);
  // What an application and a plug-in have in common.
  void checkBundle(const platform::BundleRegistration& bundle);
  void checkExecutable(const platform::BundleRegistration& bundle, bool needed);
  void checkLocalization(const std::string& path);
  // Parts of checkPlugIn.
  void checkRecord(const platform::BundleRegistration& plugIn, const std::string& application);
  void checkIdentifier(const platform::BundleRegistration& plugIn);
  void checkVersion(const platform::BundleRegistration& plugIn);
  void checkExtensionPoint(const platform::BundleRegistration& plugIn);
  void checkShared(const platform::BundleRegistration& plugIn);
  void checkService(const platform::BundleRegistration& plugIn);

  const extora::XTExtensionPoints& points_;
  const std::string profiles_;
  std::vector<Finding> findings_;
  std::vector<std::pair<std::string, platform::Value>> plugIns_;
  std::map<std::string, std::string> pathOfIdentifier_;
};

}  // namespace tools
