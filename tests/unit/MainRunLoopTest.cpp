#include "platform/queue/MainRunLoop.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/epoll.h>
#include <unistd.h>

#include <array>
#include <string>
#include <thread>
#include <vector>

#include "platform/files/UniqueFd.h"

namespace platform {
namespace {

TEST(MainRunLoopTest, ServesSignalsDescriptorsTimersAndWorkUntilItIsStopped) {
  MainRunLoop& loop = MainRunLoop::main();
  sigset_t before;
  pthread_sigmask(SIG_SETMASK, nullptr, &before);
  MainRunLoop::blockSignals();
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe(ends.data()), 0);
  const UniqueFd in(ends[0]);
  const UniqueFd out(ends[1]);

  std::vector<std::string> seen;
  const auto self = std::this_thread::get_id();
  int ticks = 0;
  const auto timer = loop.addTimer(1, [&] {
    if (++ticks == 3) loop.async([&] { ASSERT_EQ(::write(out.get(), "x", 1), 1); });
  });
  std::unique_ptr<MainRunLoop::Source> reader = loop.addFd(in.get(), EPOLLIN, [&](std::uint32_t events) {
    EXPECT_TRUE((events & EPOLLIN) != 0);
    seen.emplace_back("descriptor");
    reader.reset();  // a source may end itself
    ::kill(::getpid(), SIGTERM);
  });
  const auto signal = loop.addSignal(SIGTERM, [&] {
    seen.emplace_back("signal");
    EXPECT_EQ(std::this_thread::get_id(), self);
    std::thread([&] {
      loop.async([&] { seen.emplace_back("first"); });
      loop.async([&] { seen.emplace_back("second"); });
      loop.stop();
    }).join();
  });
  loop.run();
  EXPECT_EQ(seen, (std::vector<std::string>{"descriptor", "signal", "first", "second"}));
  EXPECT_GE(ticks, 3);
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

}  // namespace
}  // namespace platform
