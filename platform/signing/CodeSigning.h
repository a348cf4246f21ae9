// Code signing: entitlements of processes and bundles, and the rule of trust under which they count.
//
// The rule of trust: the executable, the entitlements file and the Info.plist are regular files (no link), and they and
// every directory above them up to "/" are owned by root or by the daemon's own user and writable by nobody else (a
// group counts as somebody else; a sticky directory is fine); files on a FUSE file system never count.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/PeerIdentity.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

/// The code-signing identity of one process; answers its entitlements. Nothing is cached but the refusal of a peer,
/// which is for good. Safe for use by several threads.
class CodeSigningTask {
 public:
  virtual ~CodeSigningTask() = default;
  /// The value of one entitlement, or nothing. `error` is set when the look-up itself failed (entitlements refused by
  /// the rule of trust, or not readable), on the first question only. Nothing and no error are: no entitlements file; a
  /// process that has ended; an executable that was deleted or replaced, or that is another file at its path here.
  virtual Value copyEntitlementValue(const std::string& name, Error* error) = 0;
};

class CodeSigning {
 public:
  virtual ~CodeSigning() = default;
  /// The task of a peer; null when none can be made (the peer has gone).
  virtual std::shared_ptr<CodeSigningTask> taskForAuditToken(const std::shared_ptr<const PeerIdentity>& peer) = 0;
  static std::shared_ptr<CodeSigning> make();
};

/// Says why `path` does not satisfy the rule of trust, or nothing when it does. `path` may be a file or a directory;
/// links in the way to it are resolved first, itself it must not be one.
std::optional<Error> trustProblem(const std::string& path);

/// The same of a whole bundle: its Info.plist (which must be readable), its entitlements file and its executable, as
/// far as it has them, and all directories above these.
std::optional<Error> bundleTrustProblem(const std::string& bundlePath);

/// The entitlements of the bundle at `bundlePath` (its Entitlements.plist) under the rule of trust (executable when it
/// has one, entitlements file, Info.plist). The nothing value when there is no such file, or, with `error`, when it
/// does not count or cannot be read.
Value entitlementsOfBundle(const std::string& bundlePath, Error* error);

}  // namespace platform
