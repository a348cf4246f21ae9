#include "platform/queue/SerialQueue.h"

#include <gtest/gtest.h>

#include <future>
#include <memory>
#include <numeric>
#include <optional>
#include <stdexcept>
#include <thread>
#include <vector>

#include "platform/queue/DeferredWork.h"
#include "platform/queue/Group.h"
#include "platform/value/InternalInconsistency.h"
#include "tests/support/Eventually.h"

namespace platform {
namespace {

TEST(SerialQueueTest, AsynchronousAndSynchronousCallersOfManyThreadsExcludeEachOther) {
  const SerialQueue queue("shared");
  std::size_t count = 0;
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 500; ++i) {
        queue.async([&] { ++count; });
        queue.sync([&] { ++count; });
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(queue.sync([&] { return count; }), 8000U);
}

TEST(SerialQueueTest, SyncRunsOnTheCallingThreadAndKnowsWhichQueuesAreCurrent) {
  const SerialQueue outer("outer");
  const SerialQueue inner("inner");
  const auto self = std::this_thread::get_id();
  EXPECT_THROW(outer.assertOnQueue(), InternalInconsistency);
  outer.sync([&] {
    EXPECT_EQ(std::this_thread::get_id(), self);
    inner.sync([&] {
      EXPECT_TRUE(outer.isCurrent());
      EXPECT_TRUE(inner.isCurrent());
      try {
        outer.sync([] { ADD_FAILURE() << "entered its own queue"; });
        ADD_FAILURE() << "no broken contract";
      } catch (const InternalInconsistency& broken) {
        EXPECT_STREQ(broken.what(), "sync on the current queue outer");
      }
    });
    EXPECT_FALSE(inner.isCurrent());
  });
  // An exception leaves the queue usable.
  EXPECT_THROW(outer.sync([] { throw std::runtime_error("work"); }), std::runtime_error);
  EXPECT_EQ(outer.sync([] { return 7; }), 7);
}

TEST(SerialQueueTest, WorkOfADestroyedQueueStillRuns) {
  std::promise<void> started;
  std::promise<void> release;
  tests::Recorder<int> seen;
  QueueReference reference;
  {
    const SerialQueue queue("short-lived");
    reference = QueueReference(queue);
    queue.async([&] {
      started.set_value();
      release.get_future().wait();
    });
    for (int i = 0; i < 3; ++i) {
      queue.async([&seen, i] { seen.add(i); });
    }
    started.get_future().wait();
  }
  reference.async([&] { seen.add(3); });
  release.set_value();
  EXPECT_EQ(seen.waitFor(4), (std::vector<int>{0, 1, 2, 3}));
}

TEST(SerialQueueTest, ManyBlockedQueuesDoNotStarveEachOther) {
  constexpr std::size_t kQueues = 40;
  std::vector<std::unique_ptr<SerialQueue>> queues;
  Group done;
  Group gate;
  gate.enter();
  for (std::size_t i = 0; i < kQueues; ++i) {
    queues.push_back(std::make_unique<SerialQueue>("blocked"));
    done.enter();
    queues.back()->async([&] {
      gate.wait();
      done.leave();
    });
  }
  const SerialQueue free("free");
  std::promise<void> ran;
  free.async([&] { ran.set_value(); });
  ran.get_future().wait();
  gate.leave();
  done.wait();
}

using SerialQueueDeathTest = testing::Test;

TEST(SerialQueueDeathTest, ABrokenContractInQueuedWorkIsAFaultAndEndsTheProcess) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const SerialQueue queue("doomed");
  EXPECT_DEATH(
      {
        queue.async([&] { queue.sync([] {}); });
        Group forever;
        forever.enter();
        forever.wait();
      },
      "FAULT.*sync on the current queue doomed");
}

// A thread that runs an event handler, as the IPC layer does it.
class DeferredWorkTest : public testing::Test {
 protected:
  DeferredWorkTest() : before_(DeferredWork::setWatch([] {})) {}
  ~DeferredWorkTest() override {
    while (DeferredWork::flushOverdue()) {
    }
    DeferredWork::setWatch(before_);
  }
  const std::thread::id self_ = std::this_thread::get_id();
  const SerialQueue queue_{"served"};
  DeferredWork scope_;

 private:
  DeferredWork::Watch before_;
};

TEST_F(DeferredWorkTest, IsDrainedByTheSameThreadAfterTheHandlerInOrderAndWithinItsBound) {
  constexpr int kOwn = 5;
  constexpr int kFurther = 16;
  std::vector<int> seen;
  std::vector<std::thread::id> threads;
  const auto note = [&](int i) {
    seen.push_back(i);
    threads.push_back(std::this_thread::get_id());
  };
  scope_.open();
  for (int i = 0; i < kOwn; ++i) {
    queue_.async([&, i] {
      note(i);
      // Each brings more than the thread is to do for others.
      for (int j = 0; i == 0 && j < 30; ++j) queue_.async([&, j] { note(kOwn + j); });
    });
  }
  EXPECT_TRUE(seen.empty());
  scope_.closeAndDrain();
  queue_.sync([&] {
    std::vector<int> expected(kOwn + 30);
    std::iota(expected.begin(), expected.end(), 0);
    EXPECT_EQ(seen, expected);
    for (std::size_t i = 0; i < threads.size(); ++i) {
      EXPECT_EQ(threads[i] == self_, i < kOwn + kFurther) << i;
    }
  });
}

TEST_F(DeferredWorkTest, GoesToAnotherThreadWhenAnybodyElseNeedsTheQueueOrTheHandlerWaits) {
  std::optional<std::thread::id> ranOn;
  const auto work = [&] { ranOn = std::this_thread::get_id(); };
  const auto expectRunElsewhere = [&] {
    ASSERT_TRUE(ranOn.has_value());
    EXPECT_NE(*ranOn, self_);
    ranOn.reset();
  };
  scope_.open();
  // The handler's own synchronous call comes after its asynchronous work.
  queue_.async(work);
  queue_.sync([&] { expectRunElsewhere(); });
  // So does another thread's.
  queue_.async(work);
  std::thread([&] { queue_.sync([&] { expectRunElsewhere(); }); }).join();
  // Another thread's asynchronous work does not wait for the handler either.
  std::promise<void> other;
  queue_.async(work);
  std::thread([&] { queue_.async([&] { other.set_value(); }); }).join();
  other.get_future().wait();
  queue_.sync([&] { expectRunElsewhere(); });
  // A handler that waits through this layer gives its promise back,
  Group group;
  group.enter();
  queue_.async([&] {
    work();
    group.leave();
  });
  group.wait();
  queue_.sync([&] { expectRunElsewhere(); });
  // and one that waits by other means is found out by the watch.
  std::promise<void> done;
  queue_.async([&] {
    work();
    done.set_value();
  });
  while (DeferredWork::flushOverdue()) {
  }
  done.get_future().wait();
  scope_.closeAndDrain();
  queue_.sync([&] { expectRunElsewhere(); });
}

TEST(GroupTest, LeavingMoreOftenThanEnteringIsABrokenContract) {
  Group group;
  group.wait();
  group.enter(2);
  group.leave();
  group.leave();
  EXPECT_THROW(group.leave(), InternalInconsistency);
}

}  // namespace
}  // namespace platform
