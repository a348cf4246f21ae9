// All probes stand in one object, so that whoever uses one has all of them in the binary, used or not.
#include "xtd/Probes.h"

#define _SDT_HAS_SEMAPHORES 1
#include <sys/sdt.h>

// A tracer counts its listeners in the semaphore, which it finds by this name.
#define XT_PROBE(name)                                                                                       \
  extern "C" {                                                                                               \
  __attribute__((section(".probes"), used, visibility("hidden"))) unsigned short xtd_##name##_semaphore = 0; \
  }
#define XT_ENABLED(name) (__builtin_expect(*const_cast<volatile unsigned short*>(&xtd_##name##_semaphore), 0) != 0)

XT_PROBE(client__new)
XT_PROBE(client__done)
XT_PROBE(request__input)
XT_PROBE(request)
XT_PROBE(request__output)
XT_PROBE(plugin__add)
XT_PROBE(plugin__remove)
XT_PROBE(plugin__ready)
XT_PROBE(discover__raw)
XT_PROBE(db__load)
XT_PROBE(XTARInitialization__begin)
XT_PROBE(XTARInitialization__end)

namespace extora::probes {

void clientNew(int pid) {
  if (XT_ENABLED(client__new)) STAP_PROBE1(xtd, client__new, pid);
}

void clientDone(int pid) {
  if (XT_ENABLED(client__done)) STAP_PROBE1(xtd, client__done, pid);
}

bool requestInputEnabled() {
  return XT_ENABLED(request__input);
}

void requestInput(int pid, const std::string& description) {
  if (requestInputEnabled()) STAP_PROBE2(xtd, request__input, pid, description.c_str());
}

void request(int pid, const char* type) {
  if (XT_ENABLED(request)) STAP_PROBE2(xtd, request, pid, type);
}

bool requestOutputEnabled() {
  return XT_ENABLED(request__output);
}

void requestOutput(int pid, const std::string& description) {
  if (requestOutputEnabled()) STAP_PROBE2(xtd, request__output, pid, description.c_str());
}

void pluginAdd(const std::string& path) {
  if (XT_ENABLED(plugin__add)) STAP_PROBE1(xtd, plugin__add, path.c_str());
}

void pluginRemove(const std::string& path, bool exists) {
  if (XT_ENABLED(plugin__remove)) STAP_PROBE2(xtd, plugin__remove, path.c_str(), static_cast<int>(exists));
}

void pluginReady(const std::string& uuid) {
  if (XT_ENABLED(plugin__ready)) STAP_PROBE1(xtd, plugin__ready, uuid.c_str());
}

void discoverRaw(unsigned count) {
  if (XT_ENABLED(discover__raw)) STAP_PROBE1(xtd, discover__raw, count);
}

void dbLoad(const std::string& domain, std::uint64_t code) {
  if (XT_ENABLED(db__load)) STAP_PROBE2(xtd, db__load, domain.c_str(), code);
}

ARInitializationInterval::ARInitializationInterval() {
  if (XT_ENABLED(XTARInitialization__begin)) STAP_PROBE(xtd, XTARInitialization__begin);
}

ARInitializationInterval::~ARInitializationInterval() {
  if (XT_ENABLED(XTARInitialization__end)) STAP_PROBE(xtd, XTARInitialization__end);
}

}  // namespace extora::probes
