// BundleRegistry: the application registry over bundle folders.
//
// 1. Readers take the current snapshot and never wait for a change. What changes runs on the registry's own queue: it
//    looks at bundles, writes the store, publishes the next snapshot, tells the observers, then posts the notification.
// 2. A snapshot is published before the knowledge UUID that names it: whoever has read a UUID finds at least its data.
// 3. A change of locale is published by whoever tells of it, beside the queue, so that it is done before anybody else
//    hears of it; publishing_ keeps the two apart and is never held while a disk is waited for.
#pragma once

#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/container/Containers.h"
#include "platform/files/Directories.h"
#include "platform/files/Files.h"
#include "platform/locale/Locale.h"
#include "platform/notify/Notifications.h"
#include "platform/queue/Mutex.h"
#include "platform/queue/SerialQueue.h"
#include "platform/registry/ApplicationRegistry.h"
#include "platform/registry/BundleScanner.h"
#include "platform/registry/FolderWatch.h"
#include "platform/registry/KnowledgeStamp.h"
#include "platform/registry/PlugInContainers.h"
#include "platform/registry/PropertyListCache.h"
#include "platform/registry/RegistrySnapshot.h"
#include "platform/registry/RegistryStore.h"

namespace platform {

/// What the registry is built from.
struct BundleRegistryOptions {
  Directories directories;
  std::shared_ptr<Files> files;
  std::shared_ptr<Containers> containers;
  std::shared_ptr<Locale> locale;
  std::shared_ptr<Notifications> notifications = {};  ///< null: changes are not posted
  /// Follows changes of the folders while the main run loop runs.
  bool watch = true;
  /// The number of directories that are watched at most; when they do not suffice the folders are polled.
  std::size_t mostWatches = 16384;
};

/// Scans the folders before it returns: the first answer knows everything installed. Never null. Main thread.
std::shared_ptr<ApplicationRegistry> makeBundleRegistry(const BundleRegistryOptions& options);

class BundleRegistry final : public ApplicationRegistry {
 public:
  explicit BundleRegistry(const BundleRegistryOptions& options);
  /// Waits for the change in the making. Main thread.
  ~BundleRegistry() override;

  PlugInRecords registryInstalledPlugIns() override;
  std::optional<PlugInRecords> registryPlugInsMatching(const Value& query, const Filter& filter) override;
  PlugInRecord registryPlugInByUUID(const Uuid& uuid) override;
  PlugInRecord registryPlugInByURL(const Url& url) override;
  ApplicationRecord registryAppByBundleURL(const Url& url) override;
  void registryClearSchemaCaches() override;
  void registryAddObserver(std::weak_ptr<RegistryObserver> observer) override;
  std::optional<Uuid> registryKnowledgeUUID() override;
  Dictionary registryLocalizedValues(const PlugInRecord& record, const std::vector<std::string>& keys,
                                     const std::string& table) override;
  Value registryExtensionPointSDK(const std::string& identifier) override;
  std::optional<Error> registryRegisterPlugin(const Url& url) override;
  std::optional<Error> registryUnregisterPlugin(const Url& url) override;
  bool typeConformsTo(const std::string& type, const std::string& other) override;
  bool evaluateActivationRule(const Value& rule, const Value& items) override;

  /// The current snapshot, never null.
  SnapshotPtr snapshot() const;

 private:
  // What a root (the path of an application, or of a plug-in in none) is to the registry.
  enum class RootKind { None, Application, PlugIn, AddedApplication, AddedPlugIn };
  using Clock = std::chrono::steady_clock;
  // A path to look at -> whether it was away meanwhile, so that nothing of what it was counts any more.
  using Roots = std::map<std::string, bool>;
  // One group of the next snapshot, before its records are made.
  struct Prepared {
    RegistrationPtr application;
    std::vector<RegistrationPtr> plugIns;
    std::vector<std::string> containers;
  };
  struct Changes {
    StoreChange stored;
    std::vector<Prepared> groups;
    std::vector<std::string> gone;
    PlugInRecords uninstalled;
    std::set<RegistrationPtr> installed;
    bool empty() const { return groups.empty() && gone.empty(); }
  };

  // Looking (BundleRegistry_Looking.cpp).
  void firstScan(StoredRegistry stored);
  Roots everywhere() XT_REQUIRES(queue_);
  void look(const Roots& roots) XT_REQUIRES(queue_);
  void lookAt(const std::string& root, bool left, Changes& changes) XT_REQUIRES(queue_);
  ScannedGroup scan(const std::string& root, RootKind kind, bool left) XT_REQUIRES(queue_);
  ScannedGroup scanWatched(const std::string& root, RootKind kind, bool left) XT_REQUIRES(queue_);
  void leaveOutRemoved(ScannedGroup& found, bool left, StoreChange& stored) XT_REQUIRES(queue_);
  void report(const std::vector<ScanProblem>& problems) XT_REQUIRES(queue_);
  void forgetReports(const std::string& root) XT_REQUIRES(queue_);
  void commit(Changes changes) XT_REQUIRES(queue_);
  // Stores and publishes; answers the records of what was installed.
  PlugInRecords apply(Changes& changes) XT_REQUIRES(queue_);
  RootKind kindOf(const std::string& root) const XT_REQUIRES(queue_);
  void publish(const SnapshotPtr& next) XT_REQUIRES(publishing_);
  void followLocale();
  void tellObservers(const PlugInRecords& uninstalled, const PlugInRecords& installed) XT_REQUIRES(queue_);
  void postChange() XT_REQUIRES(queue_);

  // Watching (BundleRegistry_Watching.cpp).
  void handleEvents() XT_REQUIRES(queue_);
  void watchFolders() XT_REQUIRES(queue_);
  void lookAgainAt(const std::string& root, Clock::duration after) XT_REQUIRES(queue_);
  void setAlarm() XT_REQUIRES(queue_);
  void takeDue(Roots& roots) XT_REQUIRES(queue_);
  void pollIfNeeded() XT_REQUIRES(queue_);

  // Registration (BundleRegistry_Registration.cpp).
  std::optional<Error> registerPlugin(const std::string& path) XT_REQUIRES(queue_);
  std::optional<Error> unregisterPlugin(const std::string& path) XT_REQUIRES(queue_);
  void setAdded(const std::string& path, bool added) XT_REQUIRES(queue_);
  static bool isOfFolder(RootKind kind);
  static std::string rootOf(const std::string& plugIn);
  static std::optional<Error> trustProblemOf(const std::string& plugIn, const std::string& root);

  // Constant after construction.
  const BundleRegistryOptions options_;
  std::vector<std::string> applicationFolders_;  // canonical
  std::string plugInFolder_;
  std::string extensionPointFolder_;

  // What readers see.
  mutable Mutex published_;
  SnapshotPtr snapshot_ XT_GUARDED_BY(published_);
  std::vector<std::string> languages_ XT_GUARDED_BY(published_);
  KnowledgeStamp knowledge_;
  PropertyListCache lists_;
  Mutex observersMutex_;
  std::vector<std::weak_ptr<RegistryObserver>> observers_ XT_GUARDED_BY(observersMutex_);

  // Held while the next snapshot is made.
  Mutex publishing_;
  RecordContext context_ XT_GUARDED_BY(publishing_);

  SerialQueue queue_{"com.orvane.registry"};
  std::unique_ptr<RegistryStore> store_ XT_GUARDED_BY(queue_);
  std::unique_ptr<PlugInContainers> containers_ XT_GUARDED_BY(queue_);
  // What the store has, by path.
  std::unordered_map<std::string, RegistrationPtr> registrations_ XT_GUARDED_BY(queue_);
  // Root -> the plug-ins at or in it that were registered by request and that no folder has.
  std::map<std::string, std::set<std::string>> added_ XT_GUARDED_BY(queue_);
  // Plug-ins of the folders that were unregistered by request, and what they were then.
  std::map<std::string, BundleStamp> removed_ XT_GUARDED_BY(queue_);
  // Path -> what was last said about it.
  std::map<std::string, std::pair<std::string, FileStamp>> reported_ XT_GUARDED_BY(queue_);
  // Roots to look at again, when, and how long more events may put that off.
  struct Due {
    Clock::time_point when;
    Clock::time_point latest;
  };
  std::map<std::string, Due> due_ XT_GUARDED_BY(queue_);
  // When the registry is woken for them; at the latest when the first is due.
  Clock::time_point alarm_ XT_GUARDED_BY(queue_) = Clock::time_point::max();
  bool polling_ XT_GUARDED_BY(queue_) = false;

  std::unique_ptr<FolderWatch> watch_;  // null: nothing is watched
  std::unique_ptr<Locale::Observation> localeObservation_;
};

}  // namespace platform
