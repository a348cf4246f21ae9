// Following changes of the folders.
//
// Renames into and out of a folder are looked at at once: what they bring is finished. What is made in place, or
// changes inside a bundle that is watched, is looked at when it has been quiet for a moment, because copying a bundle
// is many events. Where watches run out, everything is looked at every two seconds.
#include <algorithm>

#include "platform/registry/BundleRegistry.h"
#include "platform/registry/RegistryLog.h"

namespace platform {
namespace {

constexpr auto kQuiet = std::chrono::milliseconds(100);
// A look is put off no longer than this.
constexpr auto kLongest = std::chrono::seconds(1);

}  // namespace

void BundleRegistry::watchFolders() {
  std::vector<std::string> folders = applicationFolders_;
  const auto append = [&](const std::string& folder) {
    if (!folder.empty() && std::find(folders.begin(), folders.end(), folder) == folders.end())
      folders.push_back(folder);
  };
  append(plugInFolder_);
  for (const auto& [root, paths] : added_) append(root.substr(0, root.rfind('/')));
  watch_->setFolders(std::move(folders));
}

void BundleRegistry::lookAgainAt(const std::string& root, Clock::duration after) {
  const auto now = Clock::now();
  auto when = now + after;
  // Thousands of bundles that came together are due together, at a whole second: one look instead of thousands.
  if (after > kLongest) when = std::chrono::ceil<std::chrono::seconds>(when);
  const auto [place, isNew] = due_.try_emplace(root);
  Due& due = place->second;
  if (isNew || when < due.when) {
    due = {when, std::max(when, now + kLongest)};
  } else {
    due.when = std::min(when, due.latest);
  }
  if (due.when < alarm_) watch_->wakeAt(alarm_ = due.when);
}

void BundleRegistry::setAlarm() {
  const auto first = std::min_element(due_.begin(), due_.end(),
                                      [](const auto& a, const auto& b) { return a.second.when < b.second.when; });
  alarm_ = first == due_.end() ? Clock::time_point::max() : first->second.when;
  if (first != due_.end()) watch_->wakeAt(alarm_);
}

void BundleRegistry::takeDue(Roots& roots) {
  const auto now = Clock::now();
  std::erase_if(due_, [&](const auto& each) {
    if (each.second.when > now) return false;
    roots.emplace(each.first, false);
    return true;
  });
}

void BundleRegistry::handleEvents() {
  const FolderWatch::Batch batch = watch_->take();
  Roots now;
  for (const auto& [root, change] : batch.changes) {
    if (kindOf(root) == RootKind::None && snapshot()->groupAt(root) == nullptr) continue;
    if (change.left) watch_->forgetInside(root);
    if (change.appeared) watch_->watchInside(root, BundleScanner::directoriesInside(root));
    if (change.appeared || change.inside) lookAgainAt(root, kQuiet);
    if (change.left || (!change.appeared && !change.inside)) now.emplace(root, change.left);
  }
  if (batch.due) {
    takeDue(now);
    setAlarm();
  }
  if (batch.everything) watch_->refresh();
  if (batch.everything || batch.poll) now.merge(everywhere());
  look(now);
}

void BundleRegistry::pollIfNeeded() {
  if (watch_ == nullptr || polling_ || !watch_->ranOut()) return;
  polling_ = true;
  registryLog().error("there are not enough file watches; the folders are looked at every 2 seconds");
  watch_->poll();
}

}  // namespace platform
