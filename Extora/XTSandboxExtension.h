// XTSandboxExtension: a sandbox extension token, with which a process widens its own sandbox and later gives that up.
//
// Used by one owner at a time; the token alone may be read and written by any thread. Consuming and giving up wait for
// the operating system's service: not to be called from an IPC event handler.
#pragma once

#include <cstdint>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/queue/Mutex.h"

namespace extora {

class XTSandboxExtension {
 public:
  /// An unconsumed extension.
  explicit XTSandboxExtension(std::string extension) : token_(std::move(extension)) {}
  virtual ~XTSandboxExtension();
  XTSandboxExtension(const XTSandboxExtension&) = delete;
  XTSandboxExtension& operator=(const XTSandboxExtension&) = delete;

  /// Equal are extensions with equal tokens.
  bool isEqual(const XTSandboxExtension& other) const { return token() == other.token(); }
  /// Consumes the token, once; a failure is logged and leaves it unconsumed, so that it may be tried again.
  void consume();
  /// Releases a consumed token, which is unconsumed afterwards even when that fails (logged).
  void expel();

  std::string token() const;
  void setToken(std::string token);
  /// What consuming gave; -1 while it is not consumed.
  std::int64_t handle() const { return handle_; }
  void setHandle(std::int64_t handle) { handle_ = handle; }
  /// What a consumed file token grants: the file or directory, opened for reading; what lies in a directory is reached
  /// by openat(). -1 otherwise. The extension owns it.
  int descriptor() const { return descriptor_.get(); }

 private:
  mutable platform::Mutex mutex_;
  std::string token_ XT_GUARDED_BY(mutex_);
  std::int64_t handle_ = -1;
  platform::UniqueFd descriptor_;
};

}  // namespace extora
