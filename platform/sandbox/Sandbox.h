// Sandbox: whether a process is confined, and the extension tokens that widen a confinement. Callable from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/PeerIdentity.h"
#include "platform/sandbox/ExtensionTokens.h"

namespace platform {

class Sandbox {
 public:
  virtual ~Sandbox() = default;
  /// True when the process's user namespace, or the device and inode of its root directory, differ from this process's;
  /// what cannot be read counts as sandboxed.
  virtual bool isSandboxedByAuditToken(const PeerIdentity& peer) = 0;

  // Tokens, as ExtensionTokens has them: of a key of this object's own, so that they are worth nothing to another one.

  /// A token for reading at and below `path`, which must lie, in its canonical form, at or below `boundary` (EPERM).
  [[nodiscard]] virtual std::optional<std::string> issueFileReadExtension(const std::string& path,
                                                                          const std::string& boundary,
                                                                          int* errorNumber) {
    return tokens_.issueFileRead(path, boundary, errorNumber);
  }
  /// A token of `extensionClass` for the use of the service `name`.
  [[nodiscard]] virtual std::optional<std::string> issueServiceExtension(const std::string& extensionClass,
                                                                         const std::string& name, int* errorNumber) {
    return tokens_.issueService(extensionClass, name, errorNumber);
  }
  /// What a token grants; nothing and EACCES for one that this object has not issued in exactly this form.
  [[nodiscard]] virtual std::optional<SandboxGrant> verifyExtension(const std::string& token, int* errorNumber) {
    return tokens_.verify(token, errorNumber);
  }

  static std::shared_ptr<Sandbox> make();

 private:
  ExtensionTokens tokens_;
};

}  // namespace platform
