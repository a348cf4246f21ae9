#include "platform/hostservices/LaunchProfile.h"

#include <cerrno>
#include <filesystem>

#include "platform/files/Directories.h"
#include "platform/files/Files.h"
#include "platform/files/ReadFile.h"
#include "platform/plist/PropertyList.h"

namespace platform {
namespace {

constexpr std::size_t kMaxProfileBytes = std::size_t{1} << 20;

// False when `list` is neither absent nor an array of absolute paths.
bool readPaths(const Value& list, std::vector<std::string>* paths) {
  if (!list.isNothing() && !list.isArray()) return false;
  for (const Value& item : list.items()) {
    const std::filesystem::path path = std::filesystem::path(item.string()).lexically_normal();
    if (!path.is_absolute()) return false;
    paths->push_back(path.has_filename() || path == path.root_path() ? path.native() : path.parent_path().native());
  }
  return true;
}

}  // namespace

std::optional<LaunchProfile> LaunchProfile::read(const std::string& profiles, const std::string& name, Error* error) {
  const auto fail = [&](int number, const std::string& what) {
    setError(error, Error{"POSIX", number, what});
    return std::nullopt;
  };
  if (!isPathSafeName(name)) return fail(EINVAL, "\"" + name + "\" is no name of a profile");
  const std::string path = profiles + "/" + name + ".plist";
  Error reason;
  const UniqueFd file = openForReading(path, &reason);
  const auto bytes = file ? readOpenFile(file.get(), path, kMaxProfileBytes, &reason) : std::nullopt;
  if (!bytes) return fail(reason.code == kFileDoesNotExist ? ENOENT : EINVAL, "no profile " + path);
  const Value content = parsePropertyList(*bytes, &reason);
  if (!content.isDictionary()) return fail(EINVAL, "profile " + path + ": " + reason.localizedDescription());

  LaunchProfile profile;
  const Value& network = content["Network"];
  if ((!network.isNothing() && !network.isBoolean()) || !readPaths(content["ReadOnly"], &profile.readOnly) ||
      !readPaths(content["Writable"], &profile.writable)) {
    return fail(EINVAL, "profile " + path + " is malformed");
  }
  profile.network = network.exactBoolean();
  return profile;
}

}  // namespace platform
