#include "Extora/XTNotificationWatcher.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "tests/support/TestPlatform.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
constexpr const char* kName = "com.example.change";
constexpr std::chrono::seconds kDeadline{30};

class XTNotificationWatcherTest : public testing::Test {
 protected:
  XTNotificationWatcherTest() {
    directories_.runtime = directory_.path("run");
    ::setenv("EXTORA_RUNTIME_DIR", directories_.runtime.c_str(), 1);
    notifications_ = platform::Notifications::make(directories_);
  }
  ~XTNotificationWatcherTest() override { ::unsetenv("EXTORA_RUNTIME_DIR"); }
  void post(int times = 1) {
    for (; times > 0; --times) notifications_->postNotification(kName);
  }

  tests::TemporaryDirectory directory_;
  platform::Directories directories_;
  std::shared_ptr<platform::Notifications> notifications_;
};

TEST_F(XTNotificationWatcherTest, FollowsANotificationThatComesGoesAndIsMadeAnew) {
  const auto watcher = XTNotificationWatcher::initWithName(kName);
  ASSERT_NE(watcher, nullptr);
  const fs::path runtime = directories_.runtime;
  post(2);
  EXPECT_EQ(watcher->wait(kDeadline), 2U) << "not even the runtime directory was there";
  for (const fs::path& lost : {runtime / "notify" / kName, runtime / "notify", runtime}) {
    fs::remove_all(lost);
    notifications_->prepare(kName);
    EXPECT_EQ(watcher->wait(kDeadline), 1U) << lost;
    EXPECT_EQ(watcher->wait(std::chrono::milliseconds(1)), 0U) << lost;
    post(2);
    EXPECT_EQ(watcher->wait(kDeadline), 2U) << lost;
  }
  fs::rename(runtime, runtime.string() + ".old");
  post(4);
  EXPECT_EQ(watcher->wait(kDeadline), 4U);
}

}  // namespace
}  // namespace extora
