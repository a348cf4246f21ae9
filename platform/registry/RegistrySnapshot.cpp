#include "platform/registry/RegistrySnapshot.h"

#include <algorithm>
#include <iterator>
#include <unordered_set>

namespace platform {
namespace {

const std::string& rootOf(const RegisteredGroupPtr& group) {
  return group->root();
}
const std::string& pathOf(const PlugInRecord& record) {
  return record->bundleURL->path();
}
const Uuid& uuidOf(const std::pair<Uuid, PlugInRecord>& entry) {
  return entry.first;
}

// The entries of `old` that `stays` keeps, and `added`, ordered by `key`.
template <typename T, typename Key, typename Stays>
std::vector<T> merged(const std::vector<T>& old, std::vector<T> added, const Key& key, const Stays& stays) {
  const auto before = [&](const T& a, const T& b) { return key(a) < key(b); };
  std::sort(added.begin(), added.end(), before);
  std::vector<T> result;
  result.reserve(old.size() + added.size());
  auto next = added.begin();
  for (const T& each : old) {
    if (!stays(each)) continue;
    while (next != added.end() && before(*next, each)) result.push_back(std::move(*next++));
    result.push_back(each);
  }
  std::move(next, added.end(), std::back_inserter(result));
  return result;
}

// The entry of `sorted` with `wanted` as its key, or its end.
template <typename T, typename Key, typename Wanted>
auto found(const std::vector<T>& sorted, const Wanted& wanted, const Key& key) {
  const auto place = std::lower_bound(sorted.begin(), sorted.end(), wanted,
                                      [&](const T& entry, const Wanted& value) { return key(entry) < value; });
  return place != sorted.end() && key(*place) == wanted ? place : sorted.end();
}

bool declares(const RegisteredGroup& group) {
  if (!group.applicationRegistration) return false;
  const Value& info = group.applicationRegistration->info;
  return info["HXTypeDeclarations"] || info["HXExtensionPoints"];
}

}  // namespace

RegistrySnapshot::RegistrySnapshot()
    : knowledge_(Uuid::random()), declarations_(std::make_shared<const Declarations>()), index_(plugIns_) {}

std::shared_ptr<const RegistrySnapshot::Declarations> RegistrySnapshot::declarationsOf(
    const std::vector<RegisteredGroupPtr>& groups) {
  auto all = std::make_shared<Declarations>();
  for (const RegisteredGroupPtr& group : groups) {
    if (!declares(*group)) continue;
    const Value& info = group->applicationRegistration->info;
    all->types.declare(info["HXTypeDeclarations"]);
    for (const Value::Entry& each : info["HXExtensionPoints"].entries()) {
      if (each.value.isDictionary()) all->extensionPoints.emplace(each.key, each.value);
    }
  }
  return all;
}

SnapshotPtr RegistrySnapshot::changed(std::vector<RegisteredGroupPtr> groups,
                                      const std::vector<std::string>& gone) const {
  bool declarationsChange = false;
  std::unordered_set<const InstalledGroup*> leaving;
  std::unordered_set<const ARExtoraProxy*> leavingPlugIns;
  const auto leave = [&](const std::string& root) {
    const auto group = groupAt(root);
    if (group == nullptr || !leaving.insert(group.get()).second) return;
    for (const ARExtoraProxy& record : group->plugIns) leavingPlugIns.insert(&record);
    declarationsChange = declarationsChange || declares(*group);
  };
  std::for_each(gone.begin(), gone.end(), leave);
  PlugInRecords added;
  std::vector<std::pair<Uuid, PlugInRecord>> addedByUUID;
  for (const RegisteredGroupPtr& group : groups) {
    leave(group->root());
    declarationsChange = declarationsChange || declares(*group);
    for (std::size_t i = 0; i < group->plugIns.size(); ++i) {
      added.push_back(plugInRecord(group, i));
      addedByUUID.emplace_back(*group->plugIns[i].plugInUUID, added.back());
    }
  }

  auto next = std::make_shared<RegistrySnapshot>();
  next->groups_ = merged(groups_, std::move(groups), rootOf,
                         [&](const RegisteredGroupPtr& group) { return !leaving.contains(group.get()); });
  next->plugIns_ = merged(plugIns_, std::move(added), pathOf,
                          [&](const PlugInRecord& record) { return !leavingPlugIns.contains(record.get()); });
  next->byUUID_ = merged(byUUID_, std::move(addedByUUID), uuidOf,
                         [&](const auto& entry) { return !leavingPlugIns.contains(entry.second.get()); });
  next->declarations_ = declarationsChange ? declarationsOf(next->groups_) : declarations_;
  return next;
}

PlugInRecords RegistrySnapshot::candidates(const Value& query) const {
  const auto positions = index_.candidates(query);
  if (!positions) return plugIns_;
  PlugInRecords records;
  records.reserve(positions->size());
  for (const std::uint32_t position : *positions) records.push_back(plugIns_[position]);
  return records;
}

RegisteredGroupPtr RegistrySnapshot::groupAt(const std::string& root) const {
  const auto place = found(groups_, root, rootOf);
  return place == groups_.end() ? nullptr : *place;
}

PlugInRecord RegistrySnapshot::plugInByUUID(const Uuid& uuid) const {
  const auto place = found(byUUID_, uuid, uuidOf);
  return place == byUUID_.end() ? nullptr : place->second;
}

PlugInRecord RegistrySnapshot::plugInAt(const std::string& path) const {
  const auto place = found(plugIns_, path, pathOf);
  return place == plugIns_.end() ? nullptr : *place;
}

ApplicationRecord RegistrySnapshot::applicationAt(const std::string& path) const {
  const auto group = groupAt(path);
  return group != nullptr && group->application ? ApplicationRecord(group, &*group->application) : nullptr;
}

const Value& RegistrySnapshot::extensionPoint(const std::string& identifier) const {
  static const Value nothing;
  const auto place = declarations_->extensionPoints.find(identifier);
  return place == declarations_->extensionPoints.end() ? nothing : place->second;
}

}  // namespace platform
