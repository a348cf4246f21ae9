#include "platform/queue/SerialQueue.h"

#include <gtest/gtest.h>

#include <future>
#include <numeric>
#include <optional>
#include <stdexcept>
#include <thread>
#include <vector>

#include "platform/queue/DeferredWork.h"
#include "platform/queue/Group.h"
#include "platform/value/InternalInconsistency.h"

namespace platform {
namespace {

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

}  // namespace
}  // namespace platform
