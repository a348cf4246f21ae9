// PropertyListCache: property lists of bundles and folders that are read when they are asked for (strings tables, SDK
// dictionaries) and kept while their file is unchanged. Safe for use by several threads.
#pragma once

#include <string>
#include <unordered_map>

#include "platform/files/FileState.h"
#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace platform {

class PropertyListCache {
 public:
  /// The dictionary in the file `relative` below `folder`, in which no link is followed. Nothing when there is none, or
  /// (logged once per change of the file) when it cannot be read or is no dictionary.
  Value dictionaryAt(const std::string& folder, const std::string& relative);
  /// Forgets everything.
  void clear();

 private:
  struct Cached {
    FileState state;
    Value value;
  };
  Mutex mutex_;
  std::unordered_map<std::string, Cached> cached_ XT_GUARDED_BY(mutex_);  // by path; forgets all when it is full
};

}  // namespace platform
