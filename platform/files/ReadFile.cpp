#include "platform/files/ReadFile.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>

#include "platform/files/Files.h"

namespace platform {

UniqueFd openForReading(const std::string& path, Error* error) {
  UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
  if (!fd) {
    Error problem = posixError(errno, "cannot open " + path);
    if (problem.code == ENOENT) problem.code = kFileDoesNotExist;
    setError(error, std::move(problem));
  }
  return fd;
}

std::optional<Bytes> readOpenFile(int fd, const std::string& path, std::size_t limit, Error* error) {
  const auto fail = [&](int number) {
    setError(error, posixError(number, "cannot read " + path));
    return std::nullopt;
  };
  struct stat status {};
  if (::fstat(fd, &status) != 0) return fail(errno);
  if (S_ISDIR(status.st_mode)) return fail(EISDIR);
  if (!S_ISREG(status.st_mode)) return fail(EINVAL);
  if (static_cast<std::size_t>(status.st_size) > limit) return fail(EFBIG);

  // The size is a hint alone: the file may grow meanwhile, and those of /proc say 0.
  Bytes bytes(static_cast<std::size_t>(status.st_size) + 1);
  std::size_t length = 0;
  for (;;) {
    if (length == bytes.size()) bytes.resize(std::max<std::size_t>(2 * bytes.size(), 4096));
    const ssize_t got = ::pread(fd, bytes.data() + length, bytes.size() - length, static_cast<off_t>(length));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return fail(errno);
    if (got == 0) break;
    length += static_cast<std::size_t>(got);
    if (length > limit) return fail(EFBIG);
  }
  bytes.resize(length);
  return bytes;
}

}  // namespace platform
