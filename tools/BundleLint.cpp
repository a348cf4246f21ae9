#include "tools/BundleLint.h"

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <set>

#include "Extora/XTPlugInCore.h"
#include "Extora/XTVocabulary.h"
#include "platform/bundle/PlatformBundle.h"
#include "platform/container/Containers.h"
#include "platform/hostservices/LaunchProfile.h"
#include "platform/jobs/LaunchOverlay.h"
#include "platform/signing/CodeSigning.h"

namespace tools {

namespace fs = std::filesystem;
using extora::XTExtensionPoints;
using platform::BundleRegistration;
using platform::BundleScanner;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr const char* kInfo = "/Info.plist";
constexpr const char* kEntitlements = "/Entitlements.plist";
constexpr const char* kLocalization = "/Localization";
constexpr const char* kTrustAdvice =
    "the executable, Entitlements.plist and Info.plist must be regular files, and they and every directory above them "
    "belong to root or the daemon's user and be writable by nobody else";

// The record that the daemon would make of a registered plug-in.
class LintedPlugIn : public extora::XTPlugInCore {
 public:
  LintedPlugIn(const BundleRegistration& plugIn, const std::string& application) {
    setIdentifier(plugIn.identifier());
    setUrl(platform::Url::file(plugIn.path));
    if (!application.empty()) setContainingUrl(platform::Url::file(application));
    isRecord_ = setDictionaries(plugIn.info);
  }
  bool isRecord() const { return isRecord_; }
  std::optional<platform::Url> dataContainerURL() const override {
    return platform::isPlugInContainerName(identifier()) ? std::optional(url()) : std::nullopt;
  }

 private:
  bool isRecord_ = false;
};

bool isDirectory(const std::string& path) {
  std::error_code error;
  return fs::is_directory(fs::symlink_status(path, error));
}

}  // namespace

void BundleLint::add(Severity severity, std::string file, std::string_view key, std::string problem,
                     std::string advice) {
  findings_.push_back({severity, std::move(file), std::string(key), std::move(problem), std::move(advice)});
}

void BundleLint::addScanProblems(const std::vector<platform::ScanProblem>& problems) {
  for (const auto& problem : problems) {
    if (problem.kind == platform::ScanProblem::Kind::Entitlements) continue;  // checkBundle looks at all of them
    const bool inside = problem.path.ends_with(".plist") || problem.path.ends_with(kLocalization);
    const bool missing = problem.reason.starts_with("no ");
    const bool link = problem.reason == "it is a link";
    add(inside ? Severity::Warning : Severity::Error, problem.path, {},
        (inside ? "it is not read: " : "it is left out: ") + problem.reason,
        missing ? "add it"
        : link  ? "put the bundle itself there"
                : "correct it; property lists are XML 1.0 in UTF-8, names UTF-8");
  }
}

void BundleLint::check(const std::string& path) {
  if (path.ends_with(platform::kApplicationEnding)) {
    checkApplication(path);
    return;
  }
  const auto group = BundleScanner::scanPlugIn(path, [](const auto&) { return nullptr; });
  addScanProblems(group.problems);
  if (!group.found) {
    if (group.problems.empty()) {
      add(Severity::Error, path, extora::XTExtoraInfoKey, "it is no plug-in: its Info.plist has no such key",
          "add the dictionary, or name an application's directory ...app");
    }
    return;
  }
  const auto folder = fs::path(path).parent_path();
  const auto parent = folder.parent_path().string();
  const bool inside = folder.filename() == platform::kPlugInsFolder && parent.ends_with(platform::kApplicationEnding);
  checkPlugIn(*group.plugIns[0], inside ? parent : "");
}

void BundleLint::checkApplication(const std::string& path) {
  const auto group = BundleScanner::scanApplication(path, [](const auto&) { return nullptr; });
  addScanProblems(group.problems);
  if (!group.found) return;
  const Value& info = group.application->info;
  checkBundle(*group.application);
  checkExecutable(*group.application, false);
  if (info["HBBundlePlaceholder"].isNumber() && info["HBBundlePlaceholder"].integerValue() != 0) {
    add(Severity::Warning, path + kInfo, "HBBundlePlaceholder",
        "the plug-ins of an application that has it are not offered", "remove it once the application is complete");
  }
  for (const Value& type : info["HXTypeDeclarations"].items()) {
    if (type["HXTypeIdentifier"].isString()) continue;
    add(Severity::Warning, path + kInfo, "HXTypeDeclarations", "a declaration without HXTypeIdentifier is ignored",
        "add the identifier of the type");
  }
  checkWhatIsNoPlugIn(path + "/" + platform::kPlugInsFolder, group);
  for (const auto& plugIn : group.plugIns) checkPlugIn(*plugIn, path);
}

// Directories where plug-ins lie that are none, and which the daemon passes over in silence.
void BundleLint::checkWhatIsNoPlugIn(const std::string& folder, const platform::ScannedGroup& group) {
  const auto directory = platform::openDirectory(folder);
  if (!directory) return;
  for (const auto& entry : platform::entriesOf(directory.get())) {
    const std::string path = folder + "/" + entry.name;
    const auto isIt = [&](const auto& each) { return each->path == path; };
    if (!fs::exists(path + kInfo) || std::any_of(group.plugIns.begin(), group.plugIns.end(), isIt)) continue;
    const bool told = std::any_of(group.problems.begin(), group.problems.end(),
                                  [&](const auto& problem) { return problem.path == path; });
    if (told) continue;
    add(entry.name.ends_with(".appex") ? Severity::Error : Severity::Warning, path + kInfo, extora::XTExtoraInfoKey,
        "without it this is no plug-in", "add the dictionary");
  }
}

void BundleLint::checkBundle(const BundleRegistration& bundle) {
  const Report report = [this](Finding finding) { findings_.push_back(std::move(finding)); };
  checkKeys(KeyPlace::Info, bundle.info, bundle.path + kInfo, report);
  platform::FileStamp stamp;
  const auto directory = platform::openDirectory(bundle.path);
  const Value entitlements = platform::readPropertyListIn(directory.get(), kEntitlements + 1, &stamp, nullptr);
  checkKeys(KeyPlace::Entitlements, entitlements, bundle.path + kEntitlements, report);
  platform::Error refusal;
  if (stamp.present() && platform::entitlementsOfBundle(bundle.path, &refusal).isNothing()) {
    add(Severity::Warning, bundle.path + kEntitlements, {},
        "the entitlements do not count: " + refusal.localizedDescription(), kTrustAdvice);
  }
  checkLocalization(bundle.path);
}

void BundleLint::checkExecutable(const BundleRegistration& bundle, bool needed) {
  constexpr const char* kKey = "HBBundleExecutable";
  const auto warn = [&](const std::string& problem, const char* advice) {
    add(Severity::Warning, bundle.path + kInfo, kKey, problem, advice);
  };
  if (!bundle.info[kKey]) {
    if (needed) warn("without it the plug-in cannot be made ready", "name the executable, a path below the bundle");
    return;
  }
  const auto executable = platform::PlatformBundle::create(bundle.path, platform::PlatformBundle::PathKind::Bundle)
                              ->property(platform::PlatformBundle::Property::ExecutablePath);
  struct stat status {};
  if (!executable) {
    warn("it leads to no place below the bundle", "name a path below the bundle");
  } else if (::stat(executable->c_str(), &status) != 0) {
    warn(fmt::format("there is no file \"{}\"", bundle.info[kKey].string()), "add the file, or correct its name");
  } else if (!S_ISREG(status.st_mode)) {
    warn(fmt::format("{} is no file", bundle.info[kKey].string()), "name a file");
  } else if ((status.st_mode & (S_IXUSR | S_IXGRP | S_IXOTH)) != (S_IXUSR | S_IXGRP | S_IXOTH)) {
    warn(fmt::format("{} is not executable by everybody", bundle.info[kKey].string()), "give it the mode 0755");
  }
}

void BundleLint::checkLocalization(const std::string& path) {
  const auto localization = platform::openDirectory(path + kLocalization);
  if (!localization) return;
  std::map<std::string, std::map<std::string, Value>> tables;  // table -> language -> its dictionary
  std::set<std::string> languages;
  for (const auto& language : platform::entriesOf(localization.get())) {
    if (language.kind != platform::DirectoryEntry::Kind::Directory) continue;
    languages.insert(language.name);
    const auto folder = platform::openDirectoryBelow(localization.get(), language.name);
    for (const auto& table : platform::entriesOf(folder.get())) {
      if (!table.name.ends_with(".plist")) continue;
      platform::FileStamp stamp;
      tables[table.name][language.name] = platform::readPropertyListIn(folder.get(), table.name, &stamp, nullptr);
    }
  }
  for (const auto& [table, texts] : tables) {
    std::map<std::string, std::string> keys;  // key -> a language that has it
    for (const auto& [language, dictionary] : texts) {
      for (const auto& entry : dictionary.entries()) keys.emplace(entry.key, language);
    }
    for (const std::string& language : languages) {
      const std::string file = fmt::format("{}{}/{}/{}", path, kLocalization, language, table);
      const auto found = texts.find(language);
      if (found == texts.end()) {
        add(Severity::Warning, file, {}, fmt::format("it is missing; {} has it", texts.begin()->first),
            "translate it, or leave it out everywhere");
        continue;
      }
      for (const auto& [key, other] : keys) {
        const Value& text = found->second[key];
        if (found->second.isDictionary() && !text.isString()) {
          add(Severity::Warning, file, key, text ? "it is no string" : fmt::format("it is missing; {} has it", other),
              "translate it");
        }
      }
    }
  }
}

void BundleLint::checkPlugIn(const BundleRegistration& plugIn, const std::string& application) {
  plugIns_.emplace_back(plugIn.path, plugIn.info);
  const Report report = [this](Finding finding) { findings_.push_back(std::move(finding)); };
  const std::string info = plugIn.path + kInfo;
  const Value dictionary = plugIn.info[extora::XTExtoraInfoKey];
  checkRecord(plugIn, application);
  checkBundle(plugIn);
  checkKeys(KeyPlace::PlugIn, dictionary, info, report);
  checkKeys(KeyPlace::Attributes, dictionary[extora::XTAttributesInfoKey], info, report);
  if (dictionary[extora::XTMultipleInfoKey]) {
    add(Severity::Warning, info, extora::XTMultipleInfoKey, "it is obsolete, and ignored", "remove it");
  }
  checkIdentifier(plugIn);
  checkVersion(plugIn);
  checkExtensionPoint(plugIn);
  checkShared(plugIn);
  checkService(plugIn);
  checkExecutable(plugIn, !plugIn.isDataOnly());
}

void BundleLint::checkRecord(const BundleRegistration& plugIn, const std::string& application) {
  const std::string info = plugIn.path + kInfo;
  const LintedPlugIn record(plugIn, application);
  if (!record.isRecord()) {
    const bool old = !plugIn.info[extora::XTExtoraInfoKey];
    add(Severity::Error, info, old ? extora::XTExtoraInfoKey_L : extora::XTExtoraInfoKey,
        old ? "an old-style plug-in: its attributes and its protocol are not read" : "malformed plug-in dictionary",
        old ? "name the dictionary HXExtension" : "make it a dictionary");
    return;
  }
  for (const auto& problem : record.configurationProblems()) {
    const bool unwanted = !record.pluginKey(problem.key).isNothing();
    add(Severity::Error, info, problem.key, problem.error.localizedDescription(), unwanted ? "remove it" : "add it");
  }
  for (const auto& problem : record.installationProblems()) {
    // Where it lies while its author looks at it need not be where it is installed.
    if (record.identifier().empty()) continue;  // said already
    const bool place = record.isData() || record.dataContainerURL().has_value();
    add(place ? Severity::Warning : Severity::Error, place ? plugIn.path : info,
        place ? "" : extora::HBBundleIdentifierKey, problem.error.localizedDescription(),
        place ? "put it into the PlugIns folder of an application"
              : "an identifier that can be a directory's name: letters, digits, dots, dashes and underscores");
  }
}

void BundleLint::checkIdentifier(const BundleRegistration& plugIn) {
  const std::string identifier = plugIn.identifier();
  if (identifier.empty()) return;
  const auto [other, fresh] = pathOfIdentifier_.emplace(identifier, plugIn.path);
  if (fresh) return;
  add(Severity::Warning, plugIn.path + kInfo, extora::HBBundleIdentifierKey,
      fmt::format("{} is the identifier of {}, too: only one of them is offered", identifier, other->second),
      "choose another one, unless they are versions of one plug-in");
}

void BundleLint::checkVersion(const BundleRegistration& plugIn) {
  const Value& attributes = plugIn.info[extora::XTExtoraInfoKey][extora::XTAttributesInfoKey];
  const Value& version = attributes[extora::XTVersionAttribute];
  if (!attributes.isDictionary()) return;
  const auto warn = [&](const std::string& problem, const char* advice) {
    add(Severity::Warning, plugIn.path + kInfo, extora::XTVersionAttribute, problem, advice);
  };
  if (!version) warn("without it hosts cannot tell the newest of several", "add a version to HXExtensionAttributes");
  if (!version.isString()) return;
  const std::string& text = version.string();
  const bool digits = std::all_of(text.begin(), text.end(), [](char c) { return c == '.' || (c >= '0' && c <= '9'); });
  if (text.empty() || !digits || text.front() == '.' || text.back() == '.' || text.find("..") != std::string::npos) {
    warn(fmt::format("\"{}\" does not order as versions do: only numbers compare by value", text),
         "numbers with dots between them, such as 1.10");
  }
}

void BundleLint::checkExtensionPoint(const BundleRegistration& plugIn) {
  const Value& key = plugIn.info[extora::XTExtoraInfoKey][extora::XTSDKInfoKey];
  const std::string& point = key.string();
  std::string profile(XTExtensionPoints::sandboxProfile(point).value_or(""));
  if (point == XTExtensionPoints::kKeyboardService) profile = "keyboard";
  if (point == XTExtensionPoints::kNetguardFilterData) profile = "network-filter";
  const auto warn = [&](const std::string& problem, const char* advice) {
    add(Severity::Warning, plugIn.path + kInfo, extora::XTSDKInfoKey, problem, advice);
  };
  if (key.isString() && profile.empty() && !points_.sdkDictionary(point)) {
    warn(fmt::format("no extension point {} is known here", point),
         "correct it, unless the host that brings it is not installed yet");
  }
  if (profile.empty()) profile = XTExtensionPoints::kDefaultProfile;
  platform::Error error;
  if (!plugIn.isDataOnly() && isDirectory(profiles_) && !platform::LaunchProfile::read(profiles_, profile, &error)) {
    warn(fmt::format("its sandbox profile {} cannot be used here: {}", profile, error.localizedDescription()),
         "install the profile; until then the plug-in cannot be launched");
  }
}

void BundleLint::checkShared(const BundleRegistration& plugIn) {
  if (plugIn.path.ends_with(".appex")) return;  // shares all of itself
  std::error_code error;
  const fs::path bundle = fs::canonical(plugIn.path, error);
  for (const Value& each : plugIn.info[extora::XTExtoraInfoKey][extora::XTSharedResourcesInfoKey].items()) {
    if (!each.isString()) continue;
    const fs::path resource = fs::weakly_canonical(bundle / each.string(), error);
    const bool below =
        std::mismatch(bundle.begin(), bundle.end(), resource.begin(), resource.end()).first == bundle.end();
    if (below && fs::exists(resource, error)) continue;
    add(Severity::Warning, plugIn.path + kInfo, extora::XTSharedResourcesInfoKey,
        fmt::format("{}: {}", each.string(), below ? "there is no such file" : "it leads out of the bundle"),
        "name what hosts may read by its path in the bundle");
  }
}

void BundleLint::checkService(const BundleRegistration& plugIn) {
  const Value& service = plugIn.info["IPCService"];
  if (!service.isDictionary()) return;
  if (!platform::LaunchOverlay::parse(Dictionary{{"IPCService", service}})) {
    add(Severity::Warning, plugIn.path + kInfo, "IPCService",
        "its EnvironmentVariables are no dictionary of texts and numbers: "
        "the plug-in cannot be made ready",
        "correct them");
  }
  if (service["_SandboxProfile"]) {
    add(Severity::Warning, plugIn.path + kInfo, "IPCService",
        "its _SandboxProfile is ignored: the extension point decides", "remove it");
  }
}

}  // namespace tools
