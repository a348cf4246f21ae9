#include "platform/registry/BundleRegistry.h"

#include <algorithm>

#include "platform/registry/RegistryLog.h"

namespace platform {
namespace {

// `path` without links as far as it exists, so that the paths of records are canonical.
std::string canonical(Files& files, const std::string& path) {
  std::string existing = path;
  std::string rest;
  while (true) {
    if (const auto resolved = files.resolvePath(existing)) return *resolved == "/" ? rest : *resolved + rest;
    const std::size_t slash = existing.rfind('/');
    if (slash == std::string::npos || slash == 0) return path;
    rest.insert(0, existing, slash);
    existing.resize(slash);
  }
}

void appendOnce(std::vector<std::string>& folders, std::string folder) {
  while (folder.size() > 1 && folder.back() == '/') folder.pop_back();
  if (folder.empty() || folder == "/") return;
  if (std::find(folders.begin(), folders.end(), folder) == folders.end()) folders.push_back(std::move(folder));
}

}  // namespace

std::shared_ptr<ApplicationRegistry> makeBundleRegistry(const BundleRegistryOptions& options) {
  return std::make_shared<BundleRegistry>(options);
}

BundleRegistry::BundleRegistry(const BundleRegistryOptions& options)
    : options_(options), snapshot_(std::make_shared<const RegistrySnapshot>()) {
  knowledge_.set(snapshot_->knowledge());
  const Directories& directories = options_.directories;
  std::vector<std::string> systemFolders;
  for (const std::string& each : directories.systemApplications) {
    appendOnce(systemFolders, canonical(*options_.files, each));
  }
  for (const std::string& each : directories.applications) {
    appendOnce(applicationFolders_, canonical(*options_.files, each));
  }
  for (const std::string& each : systemFolders) appendOnce(applicationFolders_, each);
  plugInFolder_ = canonical(*options_.files, directories.systemPlugIns);
  appendOnce(systemFolders, plugInFolder_);
  extensionPointFolder_ = canonical(*options_.files, directories.extensionPoints);
  context_.systemFolders = std::move(systemFolders);

  if (options_.notifications != nullptr) options_.notifications->prepare(kRegistryChangeNotification);
  // Before the folders are looked at, so that a change meanwhile is noticed.
  localeObservation_ = options_.locale->observe([this] { followLocale(); });
  context_.languages = localizationCandidates(options_.locale->current());
  languages_ = context_.languages;

  if (auto error = options_.files->createDirectory(directories.state, true, 0711)) {
    registryLog().error("state directory {}: {}", directories.state, *error);
  }
  StoredRegistry stored;
  store_ = std::make_unique<RegistryStore>(directories.state + "/registry.sqlite", stored);
  containers_ =
      std::make_unique<PlugInContainers>(options_.containers, directories.state + "/Containers", stored.containers);
  if (options_.watch) watch_ = std::make_unique<FolderWatch>(options_.mostWatches);
  queue_.sync([&] { firstScan(std::move(stored)); });
  if (watch_ != nullptr) {
    watch_->start([this] {
      queue_.async([this] {
        queue_.assertOnQueue();
        handleEvents();
      });
    });
  }
}

BundleRegistry::~BundleRegistry() {
  localeObservation_.reset();
  if (watch_ != nullptr) watch_->stop();
  queue_.sync([] {});
}

SnapshotPtr BundleRegistry::snapshot() const {
  const MutexLock lock(published_);
  return snapshot_;
}

PlugInRecords BundleRegistry::registryInstalledPlugIns() {
  return snapshot()->plugIns();
}

std::optional<PlugInRecords> BundleRegistry::registryPlugInsMatching(const Value& query, const Filter& filter) {
  PlugInRecords records = snapshot()->candidates(query);
  if (filter) {
    std::erase_if(records,
                  [&](const PlugInRecord& record) { return !filter(record->plugInIdentifier, record->entitlements); });
  }
  return records;
}

PlugInRecord BundleRegistry::registryPlugInByUUID(const Uuid& uuid) {
  return snapshot()->plugInByUUID(uuid);
}

PlugInRecord BundleRegistry::registryPlugInByURL(const Url& url) {
  return snapshot()->plugInAt(url.path());
}

ApplicationRecord BundleRegistry::registryAppByBundleURL(const Url& url) {
  return snapshot()->applicationAt(url.path());
}

void BundleRegistry::registryClearSchemaCaches() {
  lists_.clear();
}

void BundleRegistry::registryAddObserver(std::weak_ptr<RegistryObserver> observer) {
  const MutexLock lock(observersMutex_);
  observers_.push_back(std::move(observer));
}

std::optional<Uuid> BundleRegistry::registryKnowledgeUUID() {
  return knowledge_.get();
}

Dictionary BundleRegistry::registryLocalizedValues(const PlugInRecord& record, const std::vector<std::string>& keys,
                                                   const std::string& table) {
  Dictionary values;
  if (!record->bundleURL || !isPathSafeName(table)) return values;
  std::vector<std::string> languages;
  {
    const MutexLock lock(published_);
    languages = languages_;
  }
  std::vector<Value> tables;
  for (const std::string& language : languages) {
    tables.push_back(
        lists_.dictionaryAt(record->bundleURL->path(), "Localization/" + language + "/" + table + ".plist"));
  }
  for (const std::string& key : keys) {
    const auto has = [&](const Value& each) { return each[key].isString(); };
    const auto found = std::find_if(tables.begin(), tables.end(), has);
    if (found != tables.end()) values.set(key, (*found)[key]);
  }
  return values;
}

Value BundleRegistry::registryExtensionPointSDK(const std::string& identifier) {
  if (isPathSafeName(identifier)) {
    Value own = lists_.dictionaryAt(extensionPointFolder_, identifier + ".plist");
    if (own) return own;
  }
  return snapshot()->extensionPoint(identifier);
}

std::optional<Error> BundleRegistry::registryRegisterPlugin(const Url& url) {
  return queue_.sync([&] {
    queue_.assertOnQueue();
    return registerPlugin(url.path());
  });
}

std::optional<Error> BundleRegistry::registryUnregisterPlugin(const Url& url) {
  return queue_.sync([&] {
    queue_.assertOnQueue();
    return unregisterPlugin(url.path());
  });
}

bool BundleRegistry::typeConformsTo(const std::string& type, const std::string& other) {
  return snapshot()->types().conformsTo(type, other);
}

bool BundleRegistry::evaluateActivationRule(const Value& rule, const Value& items) {
  return snapshot()->types().evaluateActivationRule(rule, items);
}

}  // namespace platform
