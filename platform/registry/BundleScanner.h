// BundleScanner: looks at bundles on disk and makes registrations of them. A registration that is known already is used
// again when the bundle's files are unchanged; then nothing is parsed. Without state, for any thread.
#pragma once

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/registry/BundleFiles.h"
#include "platform/registry/BundleRegistration.h"

namespace platform {

/// The ending of an application's directory name, and the folder of its plug-ins.
inline constexpr std::string_view kApplicationEnding = ".app";
inline constexpr const char* kPlugInsFolder = "PlugIns";

/// Why something was left out, or left out of something.
struct ScanProblem {
  std::string path;
  std::string reason;
  FileStamp stamp;  ///< of the file at fault: the same problem with the same stamp is no news
  enum class Kind { LeftOut, Entitlements } kind = Kind::LeftOut;
};

/// What a look at one application, or at one plug-in outside applications, found.
struct ScannedGroup {
  bool found = false;           ///< it can be registered
  RegistrationPtr application;  ///< null for a plug-in outside applications
  std::vector<RegistrationPtr> plugIns;
  std::vector<ScanProblem> problems;
  bool young = false;  ///< it is there and its folders were changed within the last seconds: perhaps it is being copied
};

class BundleScanner {
 public:
  /// The registration that a path had before, or null.
  using Known = std::function<RegistrationPtr(const std::string& path)>;
  enum class FolderKind { Applications, PlugIns };

  /// The paths of all that may be bundles among the direct children of `folder`, sorted; empty when it is not there.
  /// Links and names that are no text are left out.
  static std::vector<std::string> rootsIn(const std::string& folder, FolderKind kind,
                                          std::vector<ScanProblem>& problems);

  /// The application at `path` with its plug-ins, or with those of the paths `only`.
  static ScannedGroup scanApplication(const std::string& path, const Known& known,
                                      const std::set<std::string>* only = nullptr);
  /// The plug-in at `path`, which is in no application.
  static ScannedGroup scanPlugIn(const std::string& path, const Known& known);

  /// Every directory whose entries matter to the bundles at and below `path`: where to watch one that is being copied.
  static std::vector<std::string> directoriesInside(const std::string& path);
};

}  // namespace platform
