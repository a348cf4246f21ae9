#include "platform/files/PosixFiles.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "platform/files/ReadFile.h"
#include "platform/files/UniqueFd.h"

namespace platform {
namespace {

constexpr std::size_t kMaxFileBytes = std::size_t{1} << 30;

std::string parentOf(const std::string& path) {
  const std::size_t end = path.find_last_not_of('/');
  const std::size_t slash = end == std::string::npos ? end : path.rfind('/', end);
  if (slash == std::string::npos) return path.starts_with('/') ? "/" : ".";
  const std::size_t last = path.find_last_not_of('/', slash);
  return last == std::string::npos ? "/" : path.substr(0, last + 1);
}

// Makes one directory with exactly `mode`; 0 or an error number.
int makeDirectory(const std::string& path, unsigned mode) {
  if (::mkdir(path.c_str(), mode & 07777U) != 0) return errno;
  const UniqueFd directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  // A mode that does not let its owner read cannot be set through an opened directory.
  const int result = directory ? ::fchmod(directory.get(), mode) : ::chmod(path.c_str(), mode);
  return result == 0 ? 0 : errno;
}

}  // namespace

std::shared_ptr<Files> Files::make() {
  return std::make_shared<PosixFiles>();
}

std::optional<Bytes> PosixFiles::readFileData(const std::string& path, Error* error) {
  const UniqueFd fd = openForReading(path, error);
  if (!fd) return std::nullopt;
  return readOpenFile(fd.get(), path, kMaxFileBytes, error);
}

std::optional<Error> PosixFiles::writeFileAtomic(const std::string& path, std::span<const std::uint8_t> bytes) {
  const std::size_t slash = path.rfind('/');
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  if (name.empty()) return posixError(EISDIR, "cannot write " + path);
  const std::string parent = parentOf(path);
  const std::string temporary = name + ".tmp";

  const UniqueFd directory(openDirectory(parent.c_str()));
  if (!directory) return posixError(errno, "cannot open the directory " + parent);
  if (auto error = writeTemporary(directory.get(), temporary.c_str(), path, bytes)) return error;
  if (renameFile(directory.get(), temporary.c_str(), name.c_str()) != 0) {
    Error error = posixError(errno, "cannot rename " + path + ".tmp to " + path);
    (void)unlinkFile(directory.get(), temporary.c_str());
    return error;
  }
  if (syncDirectory(directory.get()) != 0) return posixError(errno, "cannot flush the directory " + parent);
  return std::nullopt;
}

std::optional<Error> PosixFiles::writeTemporary(int directory, const char* name, const std::string& path,
                                                std::span<const std::uint8_t> bytes) {
  UniqueFd fd(openTemporary(directory, name));
  if (!fd && errno == EEXIST && unlinkFile(directory, name) == 0) fd.reset(openTemporary(directory, name));
  if (!fd) return posixError(errno, "cannot create " + path + ".tmp");

  const auto fail = [&](const char* what) {
    Error error = posixError(errno, what + path + ".tmp");
    (void)unlinkFile(directory, name);
    return error;
  };
  while (!bytes.empty()) {
    const ssize_t written = writeSome(fd.get(), bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written == 0) errno = EIO;
    if (written <= 0) return fail("cannot write ");
    bytes = bytes.subspan(static_cast<std::size_t>(written));
  }
  if (syncFile(fd.get()) != 0) return fail("cannot flush ");
  return std::nullopt;
}

std::optional<Error> PosixFiles::createDirectory(const std::string& path, bool intermediates, unsigned mode) {
  int number = makeDirectory(path, mode);
  if (number == ENOENT && intermediates && parentOf(path) != path) {
    if (auto error = createDirectory(parentOf(path), true, mode)) return error;
    number = makeDirectory(path, mode);
  }
  if (number == 0) return std::nullopt;
  struct stat status {};
  if (number == EEXIST && ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) return std::nullopt;
  return posixError(number, "cannot create the directory " + path);
}

std::optional<Error> PosixFiles::linkFile(const std::string& from, const std::string& to) {
  if (::link(from.c_str(), to.c_str()) == 0 || errno == EEXIST) return std::nullopt;
  return posixError(errno, "cannot link " + from + " to " + to);
}

std::optional<std::string> PosixFiles::resolvePath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr), &std::free);
  if (resolved == nullptr) return std::nullopt;
  return std::string(resolved.get());
}

int PosixFiles::openDirectory(const char* path) {
  return ::open(path, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
}

int PosixFiles::openTemporary(int directory, const char* name) {
  return ::openat(directory, name, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
}

ssize_t PosixFiles::writeSome(int fd, const std::uint8_t* bytes, std::size_t size) {
  return ::write(fd, bytes, size);
}

int PosixFiles::syncFile(int fd) {
  return ::fsync(fd);
}

int PosixFiles::renameFile(int directory, const char* from, const char* to) {
  return ::renameat(directory, from, directory, to);
}

int PosixFiles::syncDirectory(int directory) {
  return ::fsync(directory);
}

int PosixFiles::unlinkFile(int directory, const char* name) {
  return ::unlinkat(directory, name, 0);
}

}  // namespace platform
