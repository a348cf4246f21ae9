#include "platform/queue/DeferredWork.h"

#include <algorithm>
#include <atomic>
#include <utility>

#include "platform/queue/SerialQueueState.h"

namespace platform {
namespace {

constexpr std::size_t kFurtherItems = 16;

thread_local DeferredWork* openScope = nullptr;

struct Registry {
  Mutex mutex;
  std::vector<DeferredWork*> all XT_GUARDED_BY(mutex);
};

Registry& registry() {
  static auto* const instance = new Registry;
  return *instance;
}

std::atomic<DeferredWork::Watch> armWatch = nullptr;
std::atomic<bool> watchArmed = false;

}  // namespace

DeferredWork::DeferredWork() {
  MutexLock lock(registry().mutex);
  registry().all.push_back(this);
}

DeferredWork::~DeferredWork() {
  flush();
  MutexLock lock(registry().mutex);
  std::erase(registry().all, this);
}

void DeferredWork::open() {
  openScope = armWatch.load(std::memory_order_relaxed) != nullptr ? this : nullptr;
}

void DeferredWork::closeAndDrain() {
  if (openScope != this) return;
  openScope = nullptr;
  const auto queues = take();
  for (std::size_t i = 1; i < queues.size(); ++i) queues[i]->takeBackPromise(this);
  if (!queues.empty()) queues.front()->keepPromise(this, kFurtherItems);
}

DeferredWork* DeferredWork::current() noexcept {
  return openScope;
}

void DeferredWork::flushCurrent() {
  if (openScope != nullptr) openScope->flush();
}

DeferredWork::Watch DeferredWork::setWatch(Watch arm) {
  return armWatch.exchange(arm);
}

void DeferredWork::add(std::shared_ptr<SerialQueue::State> queue) {
  {
    MutexLock lock(mutex_);
    queues_.push_back(std::move(queue));
    overdue_ = false;
  }
  if (!watchArmed.exchange(true)) armWatch.load()();
}

bool DeferredWork::flushOverdue() {
  // Said before looking: work deferred from here on finds the watch unarmed and arms it again.
  watchArmed = false;
  bool left = false;
  std::vector<std::pair<const DeferredWork*, std::shared_ptr<SerialQueue::State>>> overdue;
  {
    MutexLock lock(registry().mutex);
    for (DeferredWork* scope : registry().all) {
      MutexLock scopeLock(scope->mutex_);
      if (scope->queues_.empty()) continue;
      left = true;
      if (scope->overdue_) {
        for (auto& queue : scope->queues_) overdue.emplace_back(scope, std::move(queue));
        scope->queues_.clear();
      }
      scope->overdue_ = true;
    }
  }
  for (const auto& [scope, queue] : overdue) queue->takeBackPromise(scope);
  return left && !watchArmed.exchange(true);
}

std::vector<std::shared_ptr<SerialQueue::State>> DeferredWork::take() {
  MutexLock lock(mutex_);
  return std::exchange(queues_, {});
}

void DeferredWork::flush() {
  for (const auto& queue : take()) queue->takeBackPromise(this);
}

}  // namespace platform
