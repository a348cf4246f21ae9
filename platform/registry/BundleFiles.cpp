#include "platform/registry/BundleFiles.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <memory>

#include "platform/files/Files.h"
#include "platform/plist/PropertyList.h"

namespace platform {
namespace {

FileStamp stampFrom(const struct stat& status) {
  constexpr std::int64_t kNanoseconds = 1'000'000'000;
  return {status.st_ino, static_cast<std::uint64_t>(status.st_size),
          status.st_mtim.tv_sec * kNanoseconds + status.st_mtim.tv_nsec};
}

// Everything in `fd`, whose size was `expected` a moment ago; nothing when it cannot be read or has grown too large.
std::optional<Bytes> readAll(int fd, std::size_t expected) {
  Bytes bytes(expected + 1);
  std::size_t used = 0;
  while (true) {
    if (used == bytes.size()) {
      if (used > kLargestBundleFile) {
        errno = EFBIG;
        return std::nullopt;
      }
      bytes.resize(2 * used);
    }
    const ssize_t count = ::read(fd, bytes.data() + used, bytes.size() - used);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return std::nullopt;
    if (count == 0) break;
    used += static_cast<std::size_t>(count);
  }
  bytes.resize(used);
  return bytes;
}

DirectoryEntry::Kind kindOf(int directory, const dirent& entry) {
  unsigned char type = entry.d_type;
  struct stat status {};
  if (type == DT_UNKNOWN && ::fstatat(directory, entry.d_name, &status, AT_SYMLINK_NOFOLLOW) == 0) {
    type = S_ISDIR(status.st_mode) ? DT_DIR : S_ISLNK(status.st_mode) ? DT_LNK : DT_REG;
  }
  return type == DT_DIR   ? DirectoryEntry::Kind::Directory
         : type == DT_LNK ? DirectoryEntry::Kind::Link
                          : DirectoryEntry::Kind::Other;
}

}  // namespace

UniqueFd openDirectory(const std::string& path) {
  return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

UniqueFd openDirectoryBelow(int directory, std::string_view relative) {
  UniqueFd reached;
  while (!relative.empty()) {
    const std::string component(relative.substr(0, relative.find('/')));
    relative.remove_prefix(std::min(relative.size(), component.size() + 1));
    const int from = reached ? reached.get() : directory;
    UniqueFd next(::openat(from, component.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!next) return next;
    reached = std::move(next);
  }
  return reached;
}

FileStamp stampOf(int directory, const std::string& name) {
  struct stat status {};
  if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return {};
  return stampFrom(status);
}

Value readPropertyListIn(int directory, const std::string& name, FileStamp* stamp, Error* error) {
  *stamp = {};
  const UniqueFd fd(::openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!fd) {
    const int number = errno;
    if (number == ENOENT) {
      setError(error, {"POSIX", kFileDoesNotExist, "no " + name});
    } else {
      *stamp = stampOf(directory, name);
      setError(error, number == ELOOP ? Error{"POSIX", ELOOP, name + " is a link"} : posixError(number, name));
    }
    return {};
  }
  struct stat status {};
  if (::fstat(fd.get(), &status) != 0) {
    setError(error, posixError(errno, name));
    return {};
  }
  *stamp = stampFrom(status);
  if (!S_ISREG(status.st_mode)) {
    setError(error, {"POSIX", EINVAL, name + " is not a regular file"});
    return {};
  }
  if (stamp->size > kLargestBundleFile) {
    setError(error, {"POSIX", EFBIG, name + " is too large"});
    return {};
  }
  const std::optional<Bytes> bytes = readAll(fd.get(), stamp->size);
  if (!bytes) {
    setError(error, posixError(errno, name));
    return {};
  }
  Error reason;
  Value value = parsePropertyList(*bytes, &reason);
  if (value.isNothing()) {
    setError(error, {reason.domain, reason.code, name + ": " + reason.description.value_or("cannot be read")});
  }
  return value;
}

std::vector<DirectoryEntry> entriesOf(int directory) {
  std::vector<DirectoryEntry> entries;
  // A descriptor of its own: the stream takes it over, and two readers never share a position.
  const int own = ::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (own < 0) return entries;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(::fdopendir(own), &::closedir);
  if (!stream) {
    ::close(own);
    return entries;
  }
  while (const dirent* entry = ::readdir(stream.get())) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") entries.push_back({std::string(name), kindOf(directory, *entry)});
  }
  std::sort(entries.begin(), entries.end(),
            [](const DirectoryEntry& a, const DirectoryEntry& b) { return a.name < b.name; });
  return entries;
}

}  // namespace platform
