// Preferences: <config>/preferences/<domain>.plist. A parsed file is reused only while inode, size and change time are
// equal and the change time was 50 ms old when it was read. Callable from any thread.
#pragma once

#include <memory>
#include <string>

#include "platform/files/Directories.h"
#include "platform/value/Value.h"

namespace platform {

class Preferences {
 public:
  virtual ~Preferences() = default;
  /// The value of `key` in `domain` for the current user and host, read after synchronising with storage; nothing when
  /// the domain or the key is missing or the file is not readable or malformed (logged once per change of the file).
  virtual Value preferenceValue(const std::string& domain, const std::string& key) = 0;
  static std::shared_ptr<Preferences> make(const Directories& directories);
};

}  // namespace platform
