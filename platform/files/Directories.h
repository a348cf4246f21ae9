// Directories: where an instance keeps and finds things; made once from the user id and the environment.
//
// System instance (uid 0) and user instance differ; every place has an environment variable that overrides it, which is
// how tests and the demo run beside a real instance. See docs/architecture.md for the table.
#pragma once

#include <string>
#include <vector>

namespace platform {

struct Directories {
  std::string runtime;                          ///< EXTORA_RUNTIME_DIR
  std::string state;                            ///< EXTORA_STATE_DIR
  std::string config;                           ///< EXTORA_CONFIG_DIR
  std::vector<std::string> applications;        ///< EXTORA_APPLICATIONS, a list separated by ':'
  std::vector<std::string> systemApplications;  ///< EXTORA_SYSTEM_APPLICATIONS
  std::string systemPlugIns;                    ///< EXTORA_SYSTEM_PLUGINS
  std::string extensionPoints;                  ///< EXTORA_EXTENSION_POINTS
  std::string globalAnnotations;                ///< EXTORA_GLOBAL_ANNOTATIONS, a file
  std::string profiles;                         ///< EXTORA_PROFILES
  std::string plugInUser;                       ///< EXTORA_PLUGIN_USER; empty: the user itself
  bool multiUser = false;                       ///< EXTORA_MULTI_USER

  /// For a daemon: of this process's user and environment. Relative overrides are made absolute.
  static Directories current();
  /// For a client: as current(), but the runtime directory is EXTORA_RUNTIME_DIR, else that of the user instance when
  /// it has the socket of `service`, else /run/extora.
  static Directories forClient(const std::string& service);
};

/// A name that may become a part of a path (identifier of a plug-in, extension point, notification, service):
/// [A-Za-z0-9][A-Za-z0-9._-]{0,127}.
bool isPathSafeName(const std::string& name);

}  // namespace platform
