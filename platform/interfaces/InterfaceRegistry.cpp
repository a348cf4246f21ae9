#include "platform/interfaces/InterfaceRegistry.h"

namespace platform {

InterfaceRegistry& InterfaceRegistry::shared() {
  static auto* const registry = new InterfaceRegistry;
  return *registry;
}

std::shared_ptr<InterfaceDescription> InterfaceRegistry::find(const std::string& name) const {
  const MutexLock lock(mutex_);
  const auto found = entries_.find(name);
  return found == entries_.end() ? nullptr : found->second.registered;
}

std::shared_ptr<InterfaceDescription> InterfaceRegistry::create(const std::string& name) {
  const MutexLock lock(mutex_);
  Entry& entry = entries_[name];
  if (!entry.made.expired()) return nullptr;
  auto description = std::make_shared<InterfaceDescription>(name);
  entry.made = description;
  return description;
}

void InterfaceRegistry::add(const std::shared_ptr<InterfaceDescription>& description) {
  const MutexLock lock(mutex_);
  entries_[description->name()] = {description, description};
}

}  // namespace platform
