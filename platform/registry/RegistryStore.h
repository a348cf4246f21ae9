// RegistryStore: what the registry must not forget: registrations (<state>/registry.sqlite, write-ahead log), who owns
// which data container, and what was registered or unregistered by request.
//
// A database that is damaged, or of another version, is set aside as registry.sqlite.damaged, logged, and begun anew.
// One that cannot be used at all (a full disk, say) is logged; the registry then works without a memory. Used on one
// queue.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/registry/BundleRegistration.h"

struct sqlite3;

namespace platform {

/// Who got the container `name` of an identifier first.
struct ContainerOwner {
  std::string name;
  std::string identifier;             ///< of the plug-in
  std::string applicationIdentifier;  ///< empty: the application has none, or there is no application
  std::string applicationPath;        ///< empty: there is no application
};

/// What the store held when it was opened.
struct StoredRegistry {
  std::unordered_map<std::string, RegistrationPtr> registrations;  ///< by path
  std::vector<ContainerOwner> containers;
  std::set<std::string> added;                 ///< paths of plug-ins registered by request
  std::map<std::string, BundleStamp> removed;  ///< path -> what was unregistered by request
};

/// What one change writes, in one transaction.
struct StoreChange {
  std::vector<RegistrationPtr> registrations;  ///< new, or instead of those of the same paths
  std::vector<std::string> gone;               ///< paths without registration from now on
  std::vector<ContainerOwner> containers;      ///< new, or instead of those of the same names
  /// Path -> its mark of the given kind from now on; nothing ends the mark.
  std::map<std::string, bool> added;
  std::map<std::string, std::optional<BundleStamp>> removed;
  bool empty() const {
    return registrations.empty() && gone.empty() && containers.empty() && added.empty() && removed.empty();
  }
};

class RegistryStore {
 public:
  /// Opens or makes the database at `path` and reads all of it into `stored`.
  RegistryStore(std::string path, StoredRegistry& stored);
  ~RegistryStore();
  RegistryStore(const RegistryStore&) = delete;
  RegistryStore& operator=(const RegistryStore&) = delete;

  /// Writes `change` whole or not at all. A failure is logged and answers false.
  bool write(const StoreChange& change);

 private:
  class Statement;
  bool open();
  bool load(StoredRegistry& stored);
  bool execute(const char* sql);
  bool writeAll(const StoreChange& change);
  void setAside();
  std::string lastError() const;

  const std::string path_;
  std::unique_ptr<sqlite3, int (*)(sqlite3*)> database_;
};

}  // namespace platform
