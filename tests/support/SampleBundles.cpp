#include "tests/support/SampleBundles.h"

#include <fmt/format.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "platform/plist/PropertyList.h"

namespace tests {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::Value;

constexpr fs::perms kReadable =
    fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read | fs::perms::others_read;
constexpr fs::perms kExecutable = kReadable | fs::perms::owner_exec | fs::perms::group_exec | fs::perms::others_exec;

std::string lastWord(const std::string& identifier) {
  return identifier.substr(identifier.rfind('.') + 1);
}

void makeFolder(const std::string& path) {
  if (fs::create_directory(path)) fs::permissions(path, kExecutable);
}

void writeFile(const std::string& path, const std::string& content, fs::perms mode) {
  std::ofstream file(path, std::fstream::binary | std::fstream::trunc);
  file << content;
  file.close();
  if (!file) throw std::runtime_error("cannot write " + path);
  fs::permissions(path, mode);
}

// A name in `folder` that is no bundle's.
std::string hiddenPlace(const std::string& folder) {
  static std::atomic<unsigned> count{0};
  return fmt::format("{}/.moving-{}-{}", folder, ::getpid(), ++count);
}

}  // namespace

SampleBundle samplePlugIn(const std::string& identifier, const Dictionary& attributes,
                          const std::string& extensionPoint) {
  Dictionary own(Dictionary{{"HXExtensionVersion", "1.0"}});
  for (const Value::Entry& each : attributes) own.set(each.key, each.value);
  const Dictionary plugIn{{"HXExtensionAttributes", own}, {"HXExtensionPointIdentifier", extensionPoint}};
  SampleBundle bundle;
  bundle.name = lastWord(identifier) + ".appex";
  bundle.info = {{"HBBundleIdentifier", identifier}, {"HBBundleName", lastWord(identifier)},
                 {"HBBundleVersion", "1"},           {"HBBundleShortVersionString", "1.0"},
                 {"HBBundleExecutable", "plugin"},   {"HXExtension", plugIn}};
  return bundle;
}

SampleBundle sampleApplication(const std::string& identifier, std::vector<SampleBundle> plugIns) {
  SampleBundle bundle;
  bundle.name = lastWord(identifier) + ".app";
  bundle.info = {{"HBBundleIdentifier", identifier}, {"HBBundleName", lastWord(identifier)}, {"HBBundleVersion", "1"}};
  bundle.plugIns = std::move(plugIns);
  return bundle;
}

std::vector<SampleBundle> sampleApplications(std::size_t count, std::size_t plugInsEach) {
  std::vector<SampleBundle> applications;
  for (std::size_t n = 0; n < count; ++n) {
    std::vector<SampleBundle> plugIns;
    for (std::size_t m = 0; m < plugInsEach; ++m) {
      const std::size_t ordinal = n * plugInsEach + m;
      const Dictionary attributes{{"Group", fmt::format("group{}", ordinal % 10)}};
      plugIns.push_back(samplePlugIn(fmt::format("com.example.app{}.plugin{}", n, m), attributes));
      if (ordinal % 10 != 0) continue;
      plugIns.back().tables["de/InfoPlist"] = {{"HBBundleDisplayName", fmt::format("Erweiterung {}", ordinal)}};
    }
    applications.push_back(sampleApplication(fmt::format("com.example.app{}", n), std::move(plugIns)));
  }
  return applications;
}

void setPlugInKey(SampleBundle& bundle, const std::string& key, const Value& value) {
  Dictionary plugIn(bundle.info["HXExtension"]);
  plugIn.set(key, value);
  bundle.info.set("HXExtension", plugIn);
}

void writePropertyList(const std::string& path, const Value& value) {
  platform::Error error;
  const auto text = platform::serializeXml(value, &error);
  if (!text) throw std::runtime_error(path + ": " + error.describe());
  writeFile(path, *text, kReadable);
}

std::string writeBundle(const std::string& folder, const SampleBundle& bundle) {
  const std::string path = folder + "/" + bundle.name;
  makeFolder(path);
  const std::string& executable = bundle.info["HBBundleExecutable"].string();
  if (!executable.empty() && bundle.program.empty()) {
    writeFile(path + "/" + executable, "#!/bin/sh\n", kExecutable);
  } else if (!executable.empty()) {
    fs::copy_file(bundle.program, path + "/" + executable);
    fs::permissions(path + "/" + executable, kExecutable);
  }
  if (bundle.entitlements) writePropertyList(path + "/Entitlements.plist", bundle.entitlements);
  for (const auto& [name, table] : bundle.tables) {
    const std::string localization = path + "/Localization";
    makeFolder(localization);
    makeFolder(localization + "/" + name.substr(0, name.find('/')));
    writePropertyList(localization + "/" + name + ".plist", table);
  }
  writePropertyList(path + "/Info.plist", bundle.info);
  if (!bundle.plugIns.empty()) makeFolder(path + "/PlugIns");
  for (const SampleBundle& plugIn : bundle.plugIns) writeBundle(path + "/PlugIns", plugIn);
  return path;
}

std::string installBundle(const std::string& folder, const SampleBundle& bundle) {
  const std::string place = hiddenPlace(folder);
  makeFolder(place);
  const std::string written = writeBundle(place, bundle);
  std::string path = folder + "/" + bundle.name;
  if (fs::exists(path)) removeBundle(path);
  fs::rename(written, path);
  fs::remove(place);
  return path;
}

void removeBundle(const std::string& path) {
  const std::string place = hiddenPlace(fs::path(path).parent_path());
  fs::rename(path, place);
  fs::remove_all(place);
}

}  // namespace tests
