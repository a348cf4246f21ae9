#include "platform/queue/SerialQueue.h"

#include "platform/queue/DeferredWork.h"
#include "platform/queue/SerialQueueState.h"
#include "platform/queue/ThreadPool.h"
#include "platform/queue/WorkGuard.h"
#include "platform/value/InternalInconsistency.h"

namespace platform {
namespace {

constexpr std::size_t kUnlimited = static_cast<std::size_t>(-1);

}  // namespace

SerialQueue::Frame::Frame(const State* running) noexcept : queue(running), outer(innermost) {
  innermost = this;
}

SerialQueue::Frame::~Frame() {
  innermost = outer;
}

bool SerialQueue::State::isCurrent() const noexcept {
  for (const Frame* frame = Frame::innermost; frame != nullptr; frame = frame->outer) {
    if (frame->queue == this) return true;
  }
  return false;
}

void SerialQueue::State::async(Work work) {
  MutexLock lock(mutex);
  items.push_back({std::move(work), nullptr});
  if (busy) return;
  // Only what the handler itself submits is deferred: work of other queues that it enters may count on being parallel.
  DeferredWork* const scope = Frame::innermost == nullptr ? DeferredWork::current() : nullptr;
  if (scope != nullptr && (promisedTo == nullptr || promisedTo == scope)) {
    if (promisedTo == scope) return;
    promisedTo = scope;
    scope->add(shared_from_this());
    return;
  }
  startDraining();
}

void SerialQueue::State::enter() {
  if (isCurrent()) throw InternalInconsistency("sync on the current queue " + label);
  Waiter waiter;
  {
    MutexLock lock(mutex);
    if (!busy && items.empty()) {
      busy = true;
      return;
    }
    items.push_back({nullptr, &waiter});
    if (!busy) startDraining();
  }
  DeferredWork::flushCurrent();
  MutexLock lock(mutex);
  while (!waiter.hasTurn) waiter.granted.wait(lock.native());
}

void SerialQueue::State::leave() {
  MutexLock lock(mutex);
  next();
}

void SerialQueue::State::takeBackPromise(const DeferredWork* holder) {
  MutexLock lock(mutex);
  if (promisedTo == holder) startDraining();
}

void SerialQueue::State::keepPromise(const DeferredWork* holder, std::size_t extra) {
  std::size_t own = 0;
  {
    MutexLock lock(mutex);
    if (promisedTo != holder) return;
    promisedTo = nullptr;
    busy = true;
    own = items.size();
  }
  drain(own + extra);
}

void SerialQueue::State::startDraining() {
  promisedTo = nullptr;
  busy = true;
  ThreadPool::workers().submit([self = shared_from_this()] { self->drain(kUnlimited); });
}

void SerialQueue::State::next() {
  if (items.empty()) {
    busy = false;
    return;
  }
  Waiter* const waiter = items.front().waiter;
  if (waiter == nullptr) {
    startDraining();
    return;
  }
  items.pop_front();
  waiter->hasTurn = true;
  waiter->granted.notify_one();  // under the lock: the waiter stands on its caller's stack
}

void SerialQueue::State::drain(std::size_t limit) {
  const Frame frame(this);
  for (; limit > 0; --limit) {
    Work work;
    {
      MutexLock lock(mutex);
      if (items.empty() || items.front().waiter != nullptr) {
        next();
        return;
      }
      work = std::move(items.front().work);
      items.pop_front();
    }
    runGuarded(work);
    runGuarded([&] { work = nullptr; });  // what the work owned ends on the queue too
  }
  MutexLock lock(mutex);
  next();
}

SerialQueue::SerialQueue(std::string label) : state_(std::make_shared<State>(std::move(label))) {}

SerialQueue::~SerialQueue() = default;

const std::string& SerialQueue::label() const noexcept {
  return state_->label;
}

void SerialQueue::async(Work work) const {
  state_->async(std::move(work));
}

bool SerialQueue::isCurrent() const noexcept {
  return state_->isCurrent();
}

void SerialQueue::assertOnQueue() const {
  if (!state_->isCurrent()) throw InternalInconsistency("not on the queue " + state_->label);
}

SerialQueue::Turn::Hold::Hold(State& held) : queue(held) {
  queue.enter();
}

SerialQueue::Turn::Hold::~Hold() {
  queue.leave();
}

void QueueReference::async(SerialQueue::Work work) const {
  state_->async(std::move(work));
}

}  // namespace platform
