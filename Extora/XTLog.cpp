#include "Extora/XTLog.h"

namespace extora {
namespace {

const platform::Log& category(const char* name) {
  const platform::Log* log = platform::Log::named(XTLogSubsystem, name);
  if (log != nullptr) return *log;
  platform::Log::processDefault().error("unable to create tracelog for category {}", name);
  return platform::Log::processDefault();
}

}  // namespace

const platform::Log& XTLogOps() {
  static const platform::Log& log = category("ops");
  return log;
}

const platform::Log& XTLogTraffic() {
  static const platform::Log& log = category("traffic");
  return log;
}

const platform::Log& XTLogExtension() {
  static const platform::Log& log = category("extension");
  return log;
}

const platform::Log& XTLogAr() {
  static const platform::Log& log = category("ar");
  return log;
}

const platform::Log& XTLogSandbox() {
  static const platform::Log& log = category("sandbox");
  return log;
}

platform::LogLevel XTLogFaultOrError() {
  static const platform::LogLevel level =
      platform::Log::hasInternalDiagnostics() ? platform::LogLevel::Fault : platform::LogLevel::Error;
  return level;
}

}  // namespace extora
