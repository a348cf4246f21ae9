// ConsentService: what the user has granted to which application: <state>/consent.plist, {application identifier:
// {service identifier: boolean}}. Read on every question, so that a withdrawn consent counts at once. Callable from any
// thread.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/bundle/PlatformBundle.h"
#include "platform/files/Directories.h"

namespace platform {

/// One service's record of one application.
struct ConsentRecord {
  std::string service;
  std::optional<bool> granted;  ///< nothing: the record does not say
};

class ConsentService {
 public:
  virtual ~ConsentService() = default;
  /// The records of the application whose bundle it is, by service identifier; empty for an application without any.
  /// Nothing when the service cannot answer: no file, an unreadable one (logged once per change of the file), a bundle
  /// without an identifier.
  virtual std::optional<std::vector<ConsentRecord>> consentInfoForBundle(const PlatformBundle& bundle) = 0;
  static std::shared_ptr<ConsentService> make(const Directories& directories);
};

}  // namespace platform
