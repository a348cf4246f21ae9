// Probes: the daemon's static trace probes, provider "xtd" (USDT notes with semaphores: a disabled probe is one test),
// and the signpost interval XTARInitialization. Arguments that need work are computed only behind the ...Enabled()
// test. A hyphen in a probe's name is two underscores, as tracers expect: client-new is client__new.
#pragma once

#include <cstdint>
#include <string>

namespace extora::probes {

void clientNew(int pid);
void clientDone(int pid);
bool requestInputEnabled();
void requestInput(int pid, const std::string& description);
/// `type` may be null: the request has none.
void request(int pid, const char* type);
bool requestOutputEnabled();
void requestOutput(int pid, const std::string& description);
void pluginAdd(const std::string& path);
void pluginRemove(const std::string& path, bool exists);
void pluginReady(const std::string& uuid);
void discoverRaw(unsigned count);
void dbLoad(const std::string& domain, std::uint64_t code);

/// The interval XTARInitialization: begins with the object, ends with it.
class ARInitializationInterval {
 public:
  ARInitializationInterval();
  ~ARInitializationInterval();
  ARInitializationInterval(const ARInitializationInterval&) = delete;
  ARInitializationInterval& operator=(const ARInitializationInterval&) = delete;
};

}  // namespace extora::probes
