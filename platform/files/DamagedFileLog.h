// DamagedFileLog: says that a file is damaged or malformed, once per change of that file, however often it is read.
// Lines go to the process's default log at error level. Callable from any thread.
#pragma once

#include <map>
#include <string>

#include "platform/files/FileState.h"
#include "platform/queue/Mutex.h"

namespace platform {

class DamagedFileLog {
 public:
  /// The one of the process; never released.
  static DamagedFileLog& shared();

  /// Logs "cannot use PATH: REASON" unless the file was in this very state when it was last reported.
  void report(const std::string& path, const FileState& state, const std::string& reason);

 private:
  Mutex mutex_;
  std::map<std::string, FileState> reported_ XT_GUARDED_BY(mutex_);  // bounded; forgets all when it is full
};

}  // namespace platform
