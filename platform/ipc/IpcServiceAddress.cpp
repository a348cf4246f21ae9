#include "platform/ipc/IpcServiceAddress.h"

#include <fcntl.h>
#include <fmt/format.h>

#include <algorithm>
#include <cerrno>

namespace platform {

std::string ipcServicesDirectory(const std::string& runtimeDirectory) {
  return runtimeDirectory + "/services";
}

bool IpcServiceAddress::set(const std::string& path) {
  if (path.size() >= sizeof address_.sun_path) return false;
  address_.sun_family = AF_UNIX;
  std::copy(path.begin(), path.end(), address_.sun_path);
  return true;
}

std::optional<IpcServiceAddress> IpcServiceAddress::make(const std::string& directory, const std::string& name,
                                                         Error* error) {
  IpcServiceAddress result;
  if (result.set(directory + "/" + name)) return result;
  result.directory_.reset(::open(directory.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!result.directory_) {
    setError(error, posixError(errno, directory));
    return std::nullopt;
  }
  if (result.set(fmt::format("/proc/self/fd/{}/{}", result.directory_.get(), name))) return result;
  setError(error, posixError(ENAMETOOLONG, name));
  return std::nullopt;
}

}  // namespace platform
