// XTDatabase: the daemon's view of the installed plug-ins, over the application registry, with a cache by plug-in UUID;
// owner of the annotation store.
//
// The serial queue "XTDatabase" guards the cache and every read and write of annotations. Nothing that runs on it
// enters it again. findPlugIns, findPlugInAtPath and plugInsWithinApplication run on the caller's thread and enter the
// queue once a record; they are never called from it.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/Platform.h"
#include "platform/queue/SerialQueue.h"
#include "platform/registry/ApplicationRegistry.h"
#include "xtd/XTDAnnotationStore.h"
#include "xtd/XTDPlugIn.h"
#include "xtd/XTDatabaseDelegate.h"

namespace extora {

class ElectionFilter;

class XTDatabase : public platform::RegistryObserver, public std::enable_shared_from_this<XTDatabase> {
 public:
  using PlugIns = std::vector<std::shared_ptr<XTDPlugIn>>;

  /// Null when the base initialisation fails. `databasePath`: nothing for the store's default location.
  static std::shared_ptr<XTDatabase> initWithDatabase(std::shared_ptr<platform::Platform> platform,
                                                      const std::optional<std::string>& databasePath);
  ~XTDatabase() override;

  /// The cached or newly built plug-in of a registry record; null when it has no UUID or cannot be built.
  std::shared_ptr<XTDPlugIn> plugInForProxy(const platform::PlugInRecord& record);
  /// Unordered, each plug-in once; nothing when the registry returns no list. `query` may be nothing or empty.
  std::optional<PlugIns> findPlugIns(const Value& query);
  /// Null when the registry does not know the plug-in or it cannot be built.
  std::shared_ptr<XTDPlugIn> findPlugIn(const Uuid& uuid);
  std::shared_ptr<XTDPlugIn> findPlugInAtPath(const Url& url);
  /// In the registry's order; nothing when the application has no plug-ins or is not known.
  std::optional<PlugIns> plugInsWithinApplication(const Url& url);

  // Annotations and elections (XTDatabase_Annotations.cpp).
  /// The stored annotation dictionary, or nothing.
  Value annotationForPlugIn(const XTDPlugIn& plugIn);
  /// Merges a dictionary into what is stored, or removes it all when `annotation` is nothing. A failed save is logged.
  void setAnnotation(const Value& annotation, const XTDPlugIn& plugIn);
  /// Posts the system-wide notification that hosts look again at.
  void notifyAnnotationChange();

  // Registration (XTDatabase_Registration.cpp).
  /// Has the registry register the bundle at `url`; nothing on success, else error 2.
  [[nodiscard]] std::optional<Error> addPlugIn(const Url& url);
  [[nodiscard]] std::optional<Error> removePlugIn(const Url& url);

  // Registry observer (XTDatabase_Registration.cpp).
  void pluginsDidInstall(const platform::PlugInRecords& records) override;
  void pluginsWillUninstall(const platform::PlugInRecords& records) override;

  std::weak_ptr<XTDatabaseDelegate> delegate() const;
  void setDelegate(std::weak_ptr<XTDatabaseDelegate> delegate);
  /// A cache of more plug-ins than this is emptied before the next one enters it. 0 until set.
  std::uint32_t cacheLimit() const { return cacheLimit_.load(std::memory_order_relaxed); }
  void setCacheLimit(std::uint32_t limit) { cacheLimit_.store(limit, std::memory_order_relaxed); }
  const std::shared_ptr<platform::ApplicationRegistry>& workspace() const { return platform_->registry; }
  platform::SerialQueue& _sync() XT_RETURN_CAPABILITY(sync_) { return sync_; }
  std::size_t cacheCount() const { return cacheCount_.load(std::memory_order_relaxed); }
  const std::shared_ptr<platform::Platform>& platformServices() const { return platform_; }

 protected:
  explicit XTDatabase(std::shared_ptr<platform::Platform> platform);
  /// The second half of construction, once the object is shared; false when it fails.
  [[nodiscard]] bool setupWithDatabase(const std::optional<std::string>& databasePath);

 private:
  std::shared_ptr<XTDPlugIn> createPlugInForProxy(const platform::PlugInRecord& record) XT_REQUIRES(sync_);
  // Null when there is no valid entry; an invalid one is removed.
  std::shared_ptr<XTDPlugIn> cachedPlugIn(const Uuid& uuid) XT_REQUIRES(sync_);
  // Asked on the queue, so that the callback of a later uninstall finds what is made of the record in the cache.
  platform::PlugInRecord registryRecord(const Uuid& uuid) XT_REQUIRES(sync_);
  std::optional<platform::PlugInRecords> recordsMatching(const Value& query);
  // `elections` must outlive the callback.
  platform::ApplicationRegistry::Filter electionCallback(const ElectionFilter& elections);
  void purgeCachesToLimit(std::uint32_t limit) XT_REQUIRES(sync_);
  void autoElect(const XTDPlugIn& plugIn) XT_REQUIRES(sync_);

  const std::shared_ptr<platform::Platform> platform_;
  platform::SerialQueue sync_{"XTDatabase"};
  std::unique_ptr<XTDAnnotationStore> annotations_ XT_GUARDED_BY(sync_);
  std::unordered_map<Uuid, std::shared_ptr<XTDPlugIn>> cache_ XT_GUARDED_BY(sync_);
  std::atomic<std::size_t> cacheCount_{0};  // informative copy of the cache's size
  std::atomic<std::uint32_t> cacheLimit_{0};
  mutable platform::Mutex delegateMutex_;
  std::weak_ptr<XTDatabaseDelegate> delegate_ XT_GUARDED_BY(delegateMutex_);
  std::unique_ptr<platform::Locale::Observation> regionObserver_;
};

}  // namespace extora
