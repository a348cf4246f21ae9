#include "platform/registry/BundleScanner.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>
#include <chrono>

#include "platform/files/Files.h"
#include "platform/signing/CodeSigning.h"
#include "platform/value/Utf8.h"

namespace platform {
namespace {

constexpr const char* kInfo = "Info.plist";
constexpr const char* kEntitlements = "Entitlements.plist";
constexpr const char* kLocalization = "Localization";
constexpr const char* kNamesTable = "InfoPlist.plist";
constexpr std::string_view kAppExtensionEnding = ".appex";
constexpr auto kYoung = std::chrono::seconds(10);

double now() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

bool isYoung(int directory) {
  struct stat status {};
  if (::fstat(directory, &status) != 0) return false;
  const auto modified = std::chrono::system_clock::from_time_t(status.st_mtim.tv_sec);
  const auto age = std::chrono::system_clock::now() - modified;
  return age < kYoung && age > -kYoung;  // not when the clock was set back
}

// Whether an entry of a folder of bundles is to be looked at.
bool usable(const DirectoryEntry& entry, const std::string& path, std::vector<ScanProblem>& problems) {
  if (!isXmlText(entry.name)) {
    problems.push_back({repairedXmlText(path), "its name is not UTF-8 text", {}});
    return false;
  }
  if (entry.kind == DirectoryEntry::Kind::Link) {
    problems.push_back({path, "it is a link", {}});
    return false;
  }
  return entry.kind == DirectoryEntry::Kind::Directory;
}

// The current stamp of the bundle `name` ("", or "name/") in `directory`; equal to `before` exactly when nothing of the
// bundle has changed.
BundleStamp stampLike(int directory, const std::string& name, const BundleStamp& before) {
  BundleStamp stamp;
  stamp.info = stampOf(directory, name + kInfo);
  stamp.entitlements = stampOf(directory, name + kEntitlements);
  stamp.localization = stampOf(directory, name + kLocalization);
  // While the directory is the same it has the same languages.
  if (stamp.localization != before.localization) return stamp;
  for (const auto& [language, table] : before.tables) {
    const std::string path = fmt::format("{}{}/{}/{}", name, kLocalization, language, kNamesTable);
    stamp.tables.emplace_back(language, stampOf(directory, path));
  }
  return stamp;
}

void readNames(int directory, BundleRegistration& bundle, std::vector<ScanProblem>& problems) {
  bundle.stamp.localization = stampOf(directory, kLocalization);
  if (!bundle.stamp.localization.present()) return;
  const UniqueFd localization = openDirectoryBelow(directory, kLocalization);
  if (!localization) {
    problems.push_back(
        {bundle.path + "/" + kLocalization, "it is no directory that can be read", bundle.stamp.localization});
    return;
  }
  for (const DirectoryEntry& entry : entriesOf(localization.get())) {
    if (entry.kind != DirectoryEntry::Kind::Directory || !isXmlText(entry.name)) continue;
    const UniqueFd language = openDirectoryBelow(localization.get(), entry.name);
    FileStamp stamp;
    Error error;
    const Value table = readPropertyListIn(language.get(), kNamesTable, &stamp, &error);
    bundle.stamp.tables.emplace_back(entry.name, stamp);
    if (table.isDictionary()) {
      bundle.names.push_back({entry.name, table["HBBundleDisplayName"].string(), table["HBBundleName"].string()});
    } else if (stamp.present()) {
      const std::string path = bundle.path + "/" + kLocalization + "/" + entry.name + "/" + kNamesTable;
      problems.push_back({path, error.description.value_or("it is not a dictionary"), stamp});
    }
  }
}

ScanProblem refusedEntitlements(const BundleRegistration& bundle, const Error& refusal) {
  return {bundle.path, refusal.describe(), bundle.stamp.entitlements, ScanProblem::Kind::Entitlements};
}

// The registration that the bundle at `path` had, when it may be used again; else null. `name` as for stampLike.
RegistrationPtr unchanged(int directory, const std::string& name, const std::string& path,
                          const BundleScanner::Known& known, std::vector<ScanProblem>& problems) {
  RegistrationPtr before = known(path);
  if (before == nullptr || stampLike(directory, name, before->stamp) != before->stamp) return nullptr;
  if (!before->entitlementsRefused) return before;
  // They may count by now without a change of the file: an owner or a mode was set right.
  Error refusal;
  if (!entitlementsOfBundle(path, &refusal).isNothing()) return nullptr;
  problems.push_back(refusedEntitlements(*before, refusal));
  return before;
}

enum class Need { Application, PlugIn };

// Makes a registration of the bundle at `path`, which `directory` is; null when it cannot be registered.
RegistrationPtr readBundle(int directory, const std::string& path, Need need, std::vector<ScanProblem>& problems) {
  auto bundle = std::make_shared<BundleRegistration>();
  bundle->path = path;
  Error error;
  bundle->info = readPropertyListIn(directory, kInfo, &bundle->stamp.info, &error);
  if (!bundle->info.isDictionary()) {
    const bool missing = error.code == kFileDoesNotExist && !bundle->stamp.info.present();
    // Among an application's plug-ins a plain folder is nothing to speak of.
    if (!missing || need == Need::Application || path.ends_with(kAppExtensionEnding)) {
      problems.push_back({path, error.description.value_or("Info.plist is not a dictionary"), bundle->stamp.info});
    }
    return nullptr;
  }
  if (need == Need::PlugIn && !bundle->isPlugIn()) return nullptr;

  bundle->stamp.entitlements = stampOf(directory, kEntitlements);
  // Nobody asks for an application's own.
  if (need == Need::PlugIn && bundle->stamp.entitlements.present()) {
    Error refusal;
    bundle->entitlements = entitlementsOfBundle(path, &refusal);
    bundle->entitlementsRefused = !refusal.domain.empty();
    if (bundle->entitlementsRefused) problems.push_back(refusedEntitlements(*bundle, refusal));
  }
  readNames(directory, *bundle, problems);
  bundle->uuid = Uuid::random();
  bundle->date = now();
  return bundle;
}

// Opens the directory of a bundle. Failing because there is none is no problem.
UniqueFd openBundle(const std::string& path, std::vector<ScanProblem>& problems) {
  if (!isXmlText(path)) {
    problems.push_back({repairedXmlText(path), "its name is not UTF-8 text", {}});
    return {};
  }
  UniqueFd directory = openDirectory(path);
  struct stat status {};
  if (!directory && errno != ENOENT) {
    const int number = errno;
    const bool link = ::lstat(path.c_str(), &status) == 0 && S_ISLNK(status.st_mode);
    if (link) {
      problems.push_back({path, "it is a link", {}});
    } else if (number != ENOTDIR) {
      problems.push_back({path, posixError(number, "the directory").describe(), {}});
    }
  }
  return directory;
}

void appendDirectories(const std::string& bundle, std::vector<std::string>& directories) {
  directories.push_back(bundle);
  const UniqueFd directory = openDirectory(bundle);
  const UniqueFd localization = openDirectoryBelow(directory.get(), kLocalization);
  if (!localization) return;
  directories.push_back(bundle + "/" + kLocalization);
  for (const DirectoryEntry& entry : entriesOf(localization.get())) {
    if (entry.kind == DirectoryEntry::Kind::Directory)
      directories.push_back(fmt::format("{}/{}/{}", bundle, kLocalization, entry.name));
  }
}

}  // namespace

std::vector<std::string> BundleScanner::rootsIn(const std::string& folder, FolderKind kind,
                                                std::vector<ScanProblem>& problems) {
  std::vector<std::string> roots;
  const UniqueFd directory = openDirectory(folder);
  for (const DirectoryEntry& entry : entriesOf(directory.get())) {
    if (kind == FolderKind::Applications && !entry.name.ends_with(kApplicationEnding)) continue;
    std::string path = folder + "/" + entry.name;
    if (usable(entry, path, problems)) roots.push_back(std::move(path));
  }
  return roots;
}

ScannedGroup BundleScanner::scanApplication(const std::string& path, const Known& known,
                                            const std::set<std::string>* only) {
  ScannedGroup group;
  const UniqueFd directory = openBundle(path, group.problems);
  if (!directory) return group;
  group.young = isYoung(directory.get());
  group.application = unchanged(directory.get(), "", path, known, group.problems);
  if (group.application == nullptr) {
    group.application = readBundle(directory.get(), path, Need::Application, group.problems);
  }
  if (group.application == nullptr) return group;
  group.found = true;

  const std::string folder = path + "/" + kPlugInsFolder;
  const FileStamp stamp = stampOf(directory.get(), kPlugInsFolder);
  if (!stamp.present()) return group;
  const UniqueFd plugIns = openDirectoryBelow(directory.get(), kPlugInsFolder);
  if (!plugIns) {
    group.problems.push_back({folder, "it is no directory that can be read", stamp});
    return group;
  }
  group.young = group.young || isYoung(plugIns.get());
  for (const DirectoryEntry& entry : entriesOf(plugIns.get())) {
    const std::string child = folder + "/" + entry.name;
    if ((only != nullptr && !only->contains(child)) || !usable(entry, child, group.problems)) continue;
    RegistrationPtr plugIn = unchanged(plugIns.get(), entry.name + "/", child, known, group.problems);
    if (plugIn == nullptr) {
      const UniqueFd bundle = openDirectoryBelow(plugIns.get(), entry.name);
      if (!bundle) {
        group.problems.push_back({child, posixError(errno, "the directory").describe(), {}});
        continue;
      }
      plugIn = readBundle(bundle.get(), child, Need::PlugIn, group.problems);
    }
    if (plugIn != nullptr) group.plugIns.push_back(std::move(plugIn));
  }
  return group;
}

ScannedGroup BundleScanner::scanPlugIn(const std::string& path, const Known& known) {
  ScannedGroup group;
  const UniqueFd directory = openBundle(path, group.problems);
  if (!directory) return group;
  group.young = isYoung(directory.get());
  RegistrationPtr plugIn = unchanged(directory.get(), "", path, known, group.problems);
  if (plugIn == nullptr) plugIn = readBundle(directory.get(), path, Need::PlugIn, group.problems);
  group.found = plugIn != nullptr;
  if (group.found) group.plugIns.push_back(std::move(plugIn));
  return group;
}

std::vector<std::string> BundleScanner::directoriesInside(const std::string& path) {
  std::vector<std::string> directories;
  appendDirectories(path, directories);
  const std::string folder = path + "/" + kPlugInsFolder;
  const UniqueFd plugIns = openDirectory(folder);
  if (!plugIns) return directories;
  directories.push_back(folder);
  for (const DirectoryEntry& entry : entriesOf(plugIns.get())) {
    if (entry.kind == DirectoryEntry::Kind::Directory) appendDirectories(folder + "/" + entry.name, directories);
  }
  return directories;
}

}  // namespace platform
