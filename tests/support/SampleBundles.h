// SampleBundles: writes application and plug-in bundles into folders, for tests, benchmarks and demo data. A failure of
// the file system throws (std::filesystem::filesystem_error or std::runtime_error).
#pragma once

#include <map>
#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace tests {

/// One bundle as it will lie on disk.
struct SampleBundle {
  std::string name;              ///< of its directory: "Mail.app", "Filter.appex"
  platform::Dictionary info;     ///< Info.plist
  platform::Value entitlements;  ///< Entitlements.plist; nothing: no file
  /// Localizations: "de/InfoPlist" -> the table.
  std::map<std::string, platform::Dictionary> tables;
  /// The program that becomes the executable that `info` names; empty: a shell script that does nothing.
  std::string program;
  std::vector<SampleBundle> plugIns;  ///< in its PlugIns folder
};

/// A plug-in <last word of identifier>.appex that passes the daemon's self-check and serves `extensionPoint`.
/// `attributes` are added to its own.
SampleBundle samplePlugIn(const std::string& identifier, const platform::Dictionary& attributes = {},
                          const std::string& extensionPoint = "com.example.point");
/// An application <last word of identifier>.app.
SampleBundle sampleApplication(const std::string& identifier, std::vector<SampleBundle> plugIns = {});
/// `count` applications of `plugInsEach` plug-ins with distinct identifiers (com.example.app<n>.plugin<m>), an
/// attribute "Group" of ten values, and a German localization in every tenth plug-in.
std::vector<SampleBundle> sampleApplications(std::size_t count, std::size_t plugInsEach);

/// Replaces one key of the plug-in dictionary "HXExtension".
void setPlugInKey(SampleBundle& bundle, const std::string& key, const platform::Value& value);

void writePropertyList(const std::string& path, const platform::Value& value);
/// Writes `bundle` into `folder`, file by file, in the modes that the rule of trust accepts (nobody but the owner may
/// write). Answers its path.
std::string writeBundle(const std::string& folder, const SampleBundle& bundle);
/// Installs `bundle` as an installer does: writes it beside its place, removes what is there by renaming, and renames
/// it into place. Answers its path.
std::string installBundle(const std::string& folder, const SampleBundle& bundle);
/// Removes the bundle at `path` by renaming, then deletes it.
void removeBundle(const std::string& path);

}  // namespace tests
