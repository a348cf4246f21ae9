// InterfaceRegistry: the named interface descriptions of the process. For any thread.
#pragma once

#include <map>
#include <memory>
#include <string>

#include "platform/interfaces/InterfaceDescription.h"
#include "platform/queue/Mutex.h"

namespace platform {

class InterfaceRegistry {
 public:
  static InterfaceRegistry& shared();

  /// The description that is registered under the name, or null.
  std::shared_ptr<InterfaceDescription> find(const std::string& name) const;
  /// A new description that nobody finds yet; null when the name is taken, by one that is being made too. The name is
  /// free again when the description goes without having been registered.
  [[nodiscard]] std::shared_ptr<InterfaceDescription> create(const std::string& name);
  /// Lets everybody find a description that create() has made, for the life of the process.
  void add(const std::shared_ptr<InterfaceDescription>& description);

 private:
  struct Entry {
    std::weak_ptr<InterfaceDescription> made;
    std::shared_ptr<InterfaceDescription> registered;
  };
  mutable Mutex mutex_;
  std::map<std::string, Entry> entries_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
