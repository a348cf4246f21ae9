#include "xtd/XTDatabase.h"

#include <unordered_set>
#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTVocabulary.h"
#include "xtd/ElectionFilter.h"
#include "xtd/RecordText.h"

namespace extora {

using platform::LogLevel;
using platform::PlugInRecord;
using platform::PlugInRecords;

std::shared_ptr<XTDatabase> XTDatabase::initWithDatabase(std::shared_ptr<platform::Platform> platform,
                                                         const std::optional<std::string>& databasePath) {
  std::shared_ptr<XTDatabase> database(new XTDatabase(std::move(platform)));
  return database->setupWithDatabase(databasePath) ? database : nullptr;
}

XTDatabase::XTDatabase(std::shared_ptr<platform::Platform> platform) : platform_(std::move(platform)) {}

XTDatabase::~XTDatabase() = default;

bool XTDatabase::setupWithDatabase(const std::optional<std::string>& databasePath) {
  sync_.sync([&] {
    sync_.assertOnQueue();
    annotations_ = XTDAnnotationStore::initWithDatabase(platform_, databasePath);
  });
  workspace()->registryAddObserver(weak_from_this());
  regionObserver_ = platform_->locale->observe([weak = weak_from_this()] {
    const std::shared_ptr<XTDatabase> self = weak.lock();
    if (!self) return;
    XTLogOps().def("locale change detected; purging cache");
    self->sync_.async([weak] {
      if (const std::shared_ptr<XTDatabase> database = weak.lock()) {
        database->sync_.assertOnQueue();
        database->purgeCachesToLimit(0);
      }
    });
  });
  return true;
}

std::shared_ptr<XTDPlugIn> XTDatabase::plugInForProxy(const PlugInRecord& record) {
  return sync_.sync([&]() -> std::shared_ptr<XTDPlugIn> {
    sync_.assertOnQueue();
    if (!record->plugInUUID) {
      XTLogOps().log(XTLogFaultOrError(), "Expected pluginUUID to be non-nil.");
      return nullptr;
    }
    const Uuid& uuid = *record->plugInUUID;
    if (std::shared_ptr<XTDPlugIn> cached = cachedPlugIn(uuid)) return cached;
    // The record may have been uninstalled since it was handed out, with the callback already behind us.
    return registryRecord(uuid) ? createPlugInForProxy(record) : nullptr;
  });
}

std::shared_ptr<XTDPlugIn> XTDatabase::findPlugIn(const Uuid& uuid) {
  return sync_.sync([&]() -> std::shared_ptr<XTDPlugIn> {
    sync_.assertOnQueue();
    if (std::shared_ptr<XTDPlugIn> cached = cachedPlugIn(uuid)) return cached;
    const PlugInRecord record = registryRecord(uuid);
    return record ? createPlugInForProxy(record) : nullptr;
  });
}

std::shared_ptr<XTDPlugIn> XTDatabase::cachedPlugIn(const Uuid& uuid) {
  const auto entry = cache_.find(uuid);
  if (entry == cache_.end()) return nullptr;
  if (entry->second->isStillValid()) return entry->second;
  cache_.erase(entry);
  cacheCount_ = cache_.size();
  return nullptr;
}

PlugInRecord XTDatabase::registryRecord(const Uuid& uuid) {
  PlugInRecord record = workspace()->registryPlugInByUUID(uuid);
  if (!record) XTLogOps().info("AppRegistry cannot find plug-in with UUID:{}", uuid);
  return record;
}

std::shared_ptr<XTDPlugIn> XTDatabase::createPlugInForProxy(const PlugInRecord& record) {
  sync_.assertOnQueue();
  XTLogOps().def("createPlugInForProxy");
  std::shared_ptr<XTDPlugIn> plugIn = XTDPlugIn::initWithARData(record, workspace(), weak_from_this());
  if (!plugIn) return nullptr;
  if (plugIn->hasEntitlement(XTAutoElectEntitlement)) autoElect(*plugIn);
  purgeCachesToLimit(cacheLimit());
  cache_[plugIn->uuid()] = plugIn;
  cacheCount_ = cache_.size();
  return plugIn;
}

void XTDatabase::purgeCachesToLimit(std::uint32_t limit) {
  if (cache_.size() <= limit) return;
  XTLogOps().info("purging cache for {} > {}", cache_.size(), limit);
  cache_.clear();
  cacheCount_ = 0;
  workspace()->registryClearSchemaCaches();
}

std::optional<PlugInRecords> XTDatabase::recordsMatching(const Value& query) {
  if (query.size() == 0) {
    PlugInRecords all = workspace()->registryInstalledPlugIns();
    if (XTLogAr().enabled(LogLevel::Debug)) {
      XTLogAr().debug("{} installedPlugins: {}", all.size(), describeRecords(all));
    }
    return all;
  }
  platform::ApplicationRegistry::Filter everything = [](const std::string&, const Value&) { return true; };
  const std::optional<ElectionFilter> elections = ElectionFilter::fromQuery(query);
  std::optional<PlugInRecords> found =
      workspace()->registryPlugInsMatching(query, elections ? electionCallback(*elections) : std::move(everything));
  if (XTLogAr().enabled(LogLevel::Debug)) {
    XTLogAr().debug("{} plugin(s) matching {} = {}", found ? found->size() : 0, query,
                    found ? describeRecords(*found) : Value().describe());
  }
  return found;
}

platform::ApplicationRegistry::Filter XTDatabase::electionCallback(const ElectionFilter& elections) {
  return [this, &elections](const std::string& identifier, const Value& entitlements) {
    const Value& override = entitlements[XTOverrideEntitlement];
    const std::string& key = override.isString() ? override.string() : identifier;
    const Value annotation = sync_.sync([&] {
      sync_.assertOnQueue();
      return annotations_->annotationForIdentifier(key);
    });
    Value election = annotation[XTAnnotationElectionKey];
    if (election.isNothing()) {
      const Value& automatic = entitlements[XTAutoElectEntitlement];
      election = automatic.isNumber() && automatic.booleanValue() ? 1 : 0;
    }
    const bool accepted = elections.accepts(election);
    XTLogOps().debug("ar filter {} -> {}", key, accepted ? 1 : 0);
    return accepted;
  };
}

std::optional<XTDatabase::PlugIns> XTDatabase::findPlugIns(const Value& query) {
  const std::optional<PlugInRecords> records = recordsMatching(query);
  if (!records) return std::nullopt;
  const std::size_t cachedBefore = cacheCount();
  PlugIns result;
  result.reserve(records->size());
  std::unordered_set<Uuid> seen;
  seen.reserve(records->size());
  for (const PlugInRecord& record : *records) {
    if (!record->bundleURL) {
      XTLogOps().info("skipping ar proxy {} with nil bundleURL", *record);
      continue;
    }
    if (record->containingApplication != nullptr && record->containingApplication->isPlaceholder) {
      XTLogOps().info("skipping ar proxy {} because its app is a placeholder", *record);
      continue;
    }
    std::shared_ptr<XTDPlugIn> plugIn = plugInForProxy(record);
    if (plugIn && seen.insert(plugIn->uuid()).second) result.push_back(std::move(plugIn));
  }
  XTLogOps().debug("AR reported {} plug-ins (cache {}/{})", result.size(), cachedBefore, cacheCount());
  return result;
}

std::shared_ptr<XTDPlugIn> XTDatabase::findPlugInAtPath(const Url& url) {
  const PlugInRecord record = workspace()->registryPlugInByURL(url);
  if (!record) {
    XTLogOps().info("AppRegistry cannot find plug-in at path:{}", url.path());
    return nullptr;
  }
  return record->plugInUUID ? findPlugIn(*record->plugInUUID) : plugInForProxy(record);
}

std::optional<XTDatabase::PlugIns> XTDatabase::plugInsWithinApplication(const Url& url) {
  const platform::ApplicationRecord application = workspace()->registryAppByBundleURL(url);
  if (!application || application->plugIns.empty()) return std::nullopt;
  PlugIns result;
  for (std::size_t i = 0; i < application->plugIns.size(); ++i) {
    std::shared_ptr<XTDPlugIn> plugIn = plugInForProxy(platform::plugInRecordOf(application, i));
    if (plugIn) result.push_back(std::move(plugIn));
  }
  return result;
}

std::weak_ptr<XTDatabaseDelegate> XTDatabase::delegate() const {
  const platform::MutexLock lock(delegateMutex_);
  return delegate_;
}

void XTDatabase::setDelegate(std::weak_ptr<XTDatabaseDelegate> delegate) {
  const platform::MutexLock lock(delegateMutex_);
  delegate_ = std::move(delegate);
}

}  // namespace extora
