#include "platform/bundle/PlatformBundle.h"

#include <sys/stat.h>

#include <filesystem>
#include <utility>

#include "platform/files/ReadFile.h"
#include "platform/plist/PropertyList.h"

namespace platform {
namespace {

constexpr const char* kInfoName = "Info.plist";
constexpr std::size_t kMaxInfoBytes = std::size_t{16} << 20;

std::string withoutTrailingSlash(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  return path;
}

bool isDirectory(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

// A link counts, wherever it leads: what it stands for is not taken from a bundle further up.
bool holdsInfo(const std::string& directory) {
  struct stat status {};
  return ::lstat((directory + "/" + kInfoName).c_str(), &status) == 0 && !S_ISDIR(status.st_mode);
}

std::string bundleHolding(std::string path) {
  for (std::size_t slash = path.rfind('/'); slash != std::string::npos && slash > 0; slash = path.rfind('/')) {
    path.resize(slash);
    if (holdsInfo(path)) return path;
  }
  return {};
}

}  // namespace

PlatformBundle::PlatformBundle(std::string askedPath, std::string bundlePath)
    : askedPath_(std::move(askedPath)), bundlePath_(std::move(bundlePath)) {}

std::shared_ptr<PlatformBundle> PlatformBundle::create(const std::string& path, PathKind kind) {
  const std::string asked = withoutTrailingSlash(path);
  std::string bundle = kind == PathKind::Executable ? bundleHolding(asked) : isDirectory(asked) ? asked : "";
  return std::shared_ptr<PlatformBundle>(new PlatformBundle(asked, std::move(bundle)));
}

std::shared_ptr<PlatformBundle> PlatformBundle::main() {
  std::error_code error;
  return create(std::filesystem::read_symlink("/proc/self/exe", error).string(), PathKind::Executable);
}

std::optional<std::string> PlatformBundle::property(Property property) const {
  if (bundlePath_.empty()) return std::nullopt;
  switch (property) {
    case Property::BundlePath:
    case Property::SupportPath:
      return bundlePath_;
    case Property::ExecutablePath:
      return executablePath();
  }
  return std::nullopt;
}

std::optional<std::string> PlatformBundle::executablePath() const {
  const Value name = info()["HBBundleExecutable"];
  if (name.string().empty()) return std::nullopt;
  const std::string path = bundlePath_ + "/" + name.string();
  std::error_code error;
  const std::string bundle = std::filesystem::canonical(bundlePath_, error).string();
  if (error) return std::nullopt;
  const std::string resolved = std::filesystem::weakly_canonical(path, error).string();
  const bool below = !error && resolved.size() > bundle.size() + 1 && resolved.starts_with(bundle + "/");
  return below ? std::optional(path) : std::nullopt;
}

Value PlatformBundle::info() const {
  const MutexLock lock(mutex_);
  if (!info_) {
    info_ = Value();
    const std::string path = bundlePath_ + "/" + kInfoName;
    const UniqueFd fd = bundlePath_.empty() ? UniqueFd() : openForReading(path, nullptr);
    const auto bytes = fd ? readOpenFile(fd.get(), path, kMaxInfoBytes, nullptr) : std::nullopt;
    Value parsed = bytes ? parsePropertyList(*bytes, nullptr) : Value();
    if (parsed.isDictionary()) info_ = std::move(parsed);
  }
  return *info_;
}

void PlatformBundle::dropCaches() {
  const MutexLock lock(mutex_);
  info_.reset();
}

std::string PlatformBundle::describe() const {
  return bundlePath_.empty() ? "<no bundle at " + askedPath_ + ">" : "<" + bundlePath_ + ">";
}

}  // namespace platform
