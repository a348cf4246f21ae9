// PlugInReference: what a person may name a plug-in by.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Url.h"
#include "platform/value/Uuid.h"
#include "platform/value/Value.h"
#include "tools/DaemonSession.h"
#include "tools/ExitStatus.h"

namespace tools {

/// A UUID, else a location (a file URL or a path, which is made absolute, and canonical where it exists), else an
/// identifier. A text without a "/" that names nothing in the working directory is an identifier.
struct PlugInReference {
  std::string text;
  std::optional<platform::Uuid> uuid;
  std::optional<platform::Url> url;

  static PlugInReference parse(const std::string& text);
  /// Neither UUID nor location: an identifier, or a URL that is malformed or of another kind.
  bool isIdentifier() const { return !uuid && !url; }

  /// Asks the daemon for the one plug-in that is meant and puts its form into `form`. By UUID or location it need not
  /// be offered; of an identifier it is the one that this program is offered in any version, and several are refused
  /// with a list of them. Complaints have been written when the status is not Success.
  [[nodiscard]] ExitStatus find(DaemonSession& daemon, platform::Value& form) const;
};

/// Each path made absolute, and canonical where it exists.
std::vector<std::string> absolutePaths(const std::vector<std::string>& paths);

/// For an option of the command line: an empty text, or why `text` can name no plug-in.
std::string plugInReferenceFault(const std::string& text);

}  // namespace tools
