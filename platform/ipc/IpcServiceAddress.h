// IpcServiceAddress: where the named services of a runtime directory are, as paths and as socket addresses.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include <optional>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/value/Error.h"

namespace platform {

/// <runtime>/services
std::string ipcServicesDirectory(const std::string& runtimeDirectory);

class IpcServiceAddress {
 public:
  /// The address of `<directory>/<name>`. One that is too long for a socket address leads through /proc/self/fd and
  /// holds the directory open as long as the object lives. Nothing and `error` when the directory cannot be opened
  /// then.
  [[nodiscard]] static std::optional<IpcServiceAddress> make(const std::string& directory, const std::string& name,
                                                             Error* error);

  const sockaddr* address() const noexcept { return reinterpret_cast<const sockaddr*>(&address_); }
  socklen_t size() const noexcept { return sizeof address_; }

 private:
  IpcServiceAddress() = default;
  bool set(const std::string& path);

  sockaddr_un address_ = {};
  UniqueFd directory_;
};

}  // namespace platform
