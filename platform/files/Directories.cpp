#include "platform/files/Directories.h"

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <climits>
#include <cstdlib>
#include <optional>
#include <string_view>

namespace platform {
namespace {

constexpr std::string_view kPathSafeFirst = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
constexpr std::string_view kPathSafePunctuation = "._-";
constexpr std::size_t kPathSafeLength = 128;

// The variable's value; an empty one counts as unset.
std::optional<std::string> variable(const char* name) {
  const char* value = std::getenv(name);
  if (value == nullptr || *value == '\0') return std::nullopt;
  return value;
}

std::string absolute(std::string path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
  if (path.starts_with('/')) return path;
  std::array<char, PATH_MAX> here{};
  if (::getcwd(here.data(), here.size()) == nullptr) return "/" + path;
  const std::string base(here.data());
  return base == "/" ? base + path : base + "/" + path;
}

std::string place(const char* name, std::string preset) {
  const auto value = variable(name);
  return value ? absolute(*value) : std::move(preset);
}

std::vector<std::string> places(const char* name, std::vector<std::string> preset) {
  const auto value = variable(name);
  if (!value) return preset;
  std::vector<std::string> list;
  std::string_view rest = *value;
  while (!rest.empty()) {
    const std::size_t colon = std::min(rest.find(':'), rest.size());
    if (colon > 0) list.push_back(absolute(std::string(rest.substr(0, colon))));
    rest.remove_prefix(std::min(colon + 1, rest.size()));
  }
  return list;
}

std::string home() {
  if (const auto value = variable("HOME"); value && value->starts_with('/')) return absolute(*value);
  std::array<char, 16384> buffer{};
  struct passwd entry {};
  struct passwd* found = nullptr;
  if (::getpwuid_r(::geteuid(), &entry, buffer.data(), buffer.size(), &found) == 0 && found != nullptr) {
    return absolute(found->pw_dir);
  }
  return "/";
}

// The XDG base directory; one that is not absolute is ignored, as its definition asks.
std::string xdg(const char* name, const std::string& preset) {
  const auto value = variable(name);
  return value && value->starts_with('/') ? absolute(*value) : preset;
}

std::string userRuntime() {
  return xdg("XDG_RUNTIME_DIR", "/run/user/" + std::to_string(::geteuid())) + "/extora";
}

}  // namespace

Directories Directories::current() {
  const bool system = ::geteuid() == 0;
  Directories it;
  if (system) {
    it.runtime = "/run/extora";
    it.state = "/var/lib/extora";
    it.config = "/etc/extora";
    it.applications = {"/var/lib/extora/Applications"};
    it.plugInUser = "extora-plugin";
  } else {
    const std::string home = platform::home();
    it.runtime = userRuntime();
    it.state = xdg("XDG_STATE_HOME", home + "/.local/state") + "/extora";
    it.config = xdg("XDG_CONFIG_HOME", home + "/.config") + "/extora";
    it.applications = {xdg("XDG_DATA_HOME", home + "/.local/share") + "/extora/Applications"};
    it.multiUser = true;
  }
  it.runtime = place("EXTORA_RUNTIME_DIR", it.runtime);
  it.state = place("EXTORA_STATE_DIR", it.state);
  it.config = place("EXTORA_CONFIG_DIR", it.config);
  it.applications = places("EXTORA_APPLICATIONS", it.applications);
  it.systemApplications =
      places("EXTORA_SYSTEM_APPLICATIONS", {"/System/Applications", "/usr/share/extora/Applications"});
  it.systemPlugIns = place("EXTORA_SYSTEM_PLUGINS", "/System/PlugIns");
  it.extensionPoints = place("EXTORA_EXTENSION_POINTS", "/System/ExtensionPoints");
  it.globalAnnotations = place("EXTORA_GLOBAL_ANNOTATIONS", "/var/db/Extora-Annotations");
  it.profiles = place("EXTORA_PROFILES", "/usr/share/extora/profiles");
  it.plugInUser = variable("EXTORA_PLUGIN_USER").value_or(it.plugInUser);
  const std::string multiUser = variable("EXTORA_MULTI_USER").value_or("");
  if (multiUser == "0" || multiUser == "1") it.multiUser = multiUser == "1";
  return it;
}

Directories Directories::forClient(const std::string& service) {
  Directories it = current();
  if (variable("EXTORA_RUNTIME_DIR")) return it;
  struct stat status {};
  const std::string user = userRuntime();
  const bool served = ::stat((user + "/services/" + service).c_str(), &status) == 0 && S_ISSOCK(status.st_mode);
  it.runtime = served ? user : "/run/extora";
  return it;
}

bool isPathSafeName(const std::string& name) {
  const auto safe = [](char c) {
    return kPathSafeFirst.find(c) != std::string_view::npos || kPathSafePunctuation.find(c) != std::string_view::npos;
  };
  return !name.empty() && name.size() <= kPathSafeLength && kPathSafeFirst.find(name[0]) != std::string_view::npos &&
         std::all_of(name.begin(), name.end(), safe);
}

}  // namespace platform
