#include "platform/signing/TrustWalk.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <utility>

#include "platform/files/Files.h"
#include "platform/files/ReadFile.h"
#include "platform/plist/PropertyList.h"

namespace platform {
namespace {

constexpr std::size_t kMaxFileBytes = std::size_t{16} << 20;

Error openError(int number, const std::string& path) {
  Error error = posixError(number, "cannot open " + path);
  if (number == ENOENT) error.code = kFileDoesNotExist;
  return error;
}

Error untrusted(const std::string& path, const char* why) {
  return {"POSIX", EPERM, path + " " + why};
}

// What the rule of trust says of one opened file or directory.
std::optional<Error> problemOf(int fd, const struct stat& status, const std::string& path) {
  if (S_ISLNK(status.st_mode)) return untrusted(path, "is a link");
  if (!S_ISREG(status.st_mode) && !S_ISDIR(status.st_mode)) return untrusted(path, "is not a regular file");
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) {
    return untrusted(path, "is owned neither by root nor by the user of this process");
  }
  const bool sticky = S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0;
  if (!sticky && (status.st_mode & S_IWOTH) != 0) return untrusted(path, "is writable by everybody");
  if (!sticky && (status.st_mode & S_IWGRP) != 0) return untrusted(path, "is writable by its group");
  struct statfs system {};
  if (::fstatfs(fd, &system) != 0) return posixError(errno, "cannot look at the file system of " + path);
  if (system.f_type == FUSE_SUPER_MAGIC) return untrusted(path, "is on a FUSE file system");
  return std::nullopt;
}

}  // namespace

std::optional<TrustWalk> TrustWalk::to(const std::string& path, Error* error) {
  const std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr), &std::free);
  Item root;
  root.fd.reset(::open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (resolved == nullptr || !root.fd || ::fstat(root.fd.get(), &root.status) != 0) {
    setError(error, openError(errno, path));
    return std::nullopt;
  }
  root.path = "/";
  root.problem = problemOf(root.fd.get(), root.status, root.path);

  TrustWalk walk;
  walk.directories_.push_back(std::move(root));
  std::string_view rest = resolved.get();
  while (!rest.empty()) {
    const std::size_t slash = std::min(rest.find('/'), rest.size());
    if (slash > 0 && !walk.descend(std::string(rest.substr(0, slash)), error)) return std::nullopt;
    rest.remove_prefix(std::min(slash + 1, rest.size()));
  }
  return walk;
}

bool TrustWalk::descend(const std::string& name, Error* error) {
  std::optional<Item> item = open(directories_.back(), name, error);
  if (!item) return false;
  if (!S_ISDIR(item->status.st_mode)) {
    setError(error, item->problem ? *item->problem : openError(ENOTDIR, item->path));
    return false;
  }
  directories_.push_back(std::move(*item));
  return true;
}

std::optional<Error> TrustWalk::problem() const {
  for (const Item& directory : directories_) {
    if (directory.problem) return directory.problem;
  }
  return std::nullopt;
}

std::optional<TrustWalk::Item> TrustWalk::open(const Item& directory, const std::string& name, Error* error) {
  Item item;
  item.path = (directory.path == "/" ? "" : directory.path) + "/" + name;
  item.fd.reset(::openat(directory.fd.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
  if (!item.fd || ::fstat(item.fd.get(), &item.status) != 0) {
    setError(error, openError(errno, item.path));
    return std::nullopt;
  }
  item.problem = problemOf(item.fd.get(), item.status, item.path);
  return item;
}

std::optional<TrustWalk::Item> TrustWalk::openFile(const Item& directory, const std::string& name, Error* error) {
  std::optional<Item> item = open(directory, name, error);
  if (item && !item->problem && !S_ISREG(item->status.st_mode)) {
    item->problem = untrusted(item->path, "is not a regular file");
  }
  return item;
}

Value readDictionary(const TrustWalk::Item& file, Error* error) {
  // The very file that was judged, this time for reading.
  Error problem;
  const UniqueFd fd = openForReading("/proc/self/fd/" + std::to_string(file.fd.get()), &problem);
  if (!fd) problem.description = "cannot open " + file.path;
  const auto bytes = fd ? readOpenFile(fd.get(), file.path, kMaxFileBytes, &problem) : std::nullopt;
  Value value = bytes ? parsePropertyList(*bytes, &problem) : Value();
  if (value.isDictionary()) return value;
  if (bytes) {
    problem = {kPropertyListErrorDomain, kPropertyListErrorRead,
               file.path + ": " + (value ? "not a dictionary" : problem.localizedDescription())};
  }
  setError(error, std::move(problem));
  return {};
}

}  // namespace platform
