#include <gtest/gtest.h>
#include <signal.h>
#include <sys/syscall.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>

#include "platform/assertions/ProcessAssertions.h"
#include "platform/jobs/ProcessJobManager.h"
#include "platform/queue/MainRunLoop.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/FakeRegistry.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

constexpr auto kDeadline = std::chrono::seconds(20);
constexpr const char* kIdentifier = "com.example.filter";

// A process that waits.
class Child : public tests::ChildProcess {
 public:
  Child() : ChildProcess("") {}
  ~Child() { end(); }
  void end() {
    if (peer()->isAlive()) ::kill(peer()->pid(), SIGKILL);
    ChildProcess::end();
  }
  UniqueFd pidfd() const { return UniqueFd(static_cast<int>(::syscall(SYS_pidfd_open, peer()->pid(), 0))); }
};

class JobManagerTest : public testing::Test {
 protected:
  JobManagerTest() {
    std::filesystem::create_directory(bundle_);
    std::ofstream(bundle_ + "/Info.plist") << "<plist version=\"1.0\"><dict/></plist>";
    std::ofstream(executable_) << "#!/bin/sh\n";
    std::filesystem::permissions(executable_, std::filesystem::perms::owner_all);
    install();
  }

  void install() {
    ARExtoraProxy record = tests::sampleRecord(kIdentifier);
    record.bundleURL = Url::file(std::filesystem::canonical(bundle_).native());
    plugIn_ = *record.plugInUUID;
    registry_->install(record);
  }

  // Runs the main loop until `condition` holds; false when the deadline passes first.
  static bool runUntil(const std::function<bool()>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + kDeadline;
    bool held = false;
    bool stopped = false;  // a second stop would end the next run
    const auto timer = MainRunLoop::main().addTimer(2, [&] {
      held = held || condition();
      if (stopped || (!held && std::chrono::steady_clock::now() < deadline)) return;
      stopped = true;
      MainRunLoop::main().stop();
    });
    MainRunLoop::main().run();
    return held;
  }

  int add(const Child& host, const Value& variables = {}) {
    const Dictionary service{{"EnvironmentVariables", variables}, {"_SandboxProfile", "plugin"}};
    return jobs_->jobAddExternalService(host.peer(), executable_, Dictionary{{"IPCService", service}});
  }
  // The launch, or nothing and the error number in refusal_.
  std::optional<JobManager::Launch> begin(const Child& host) {
    refusal_ = 0;
    return jobs_->beginLaunch(host.peer(), executable_, &refusal_);
  }
  std::uint64_t start(const Child& host, const Child& instance) {
    EXPECT_EQ(add(host), 0);
    const auto launch = begin(host);
    EXPECT_EQ(launch ? jobs_->instanceStarted(launch->instance, instance.pidfd()) : refusal_, 0);
    return launch ? launch->instance : 0;
  }
  void remove(const std::string& version = "1") {
    jobs_->jobRemoveExternalService(kIdentifier, version, answers_, [this](int error) {
      answers_->assertOnQueue();
      answer_ = error;
      ++answerCount_;
    });
  }
  bool answered(int count) {
    return runUntil([&] { return answerCount_ == count; });
  }

  tests::TemporaryDirectory directory_;
  const std::string bundle_ = directory_.path("Filter.appex");
  const std::string executable_ = bundle_ + "/filter";
  Uuid plugIn_;
  std::shared_ptr<tests::FakeRegistry> registry_ = std::make_shared<tests::FakeRegistry>();
  std::shared_ptr<ProcessJobManager> jobs_ = ProcessJobManager::make(registry_, 50);
  std::shared_ptr<SerialQueue> answers_ = std::make_shared<SerialQueue>("answers");
  int refusal_ = 0;
  std::atomic<int> answer_{-1};
  std::atomic<int> answerCount_{0};
};

TEST_F(JobManagerTest, ManyRemovalsOfWhatDoesNotEndCostNoThreads) {
  const Child host;
  Child stubborn;
  ::kill(stubborn.peer()->pid(), SIGSTOP);
  jobs_ = ProcessJobManager::make(registry_, 3'600'000);
  start(host, stubborn);
  constexpr int kRemovals = 10'000;
  for (int i = 0; i < kRemovals; ++i) remove();
  EXPECT_EQ(answerCount_, 0);
  const std::filesystem::directory_iterator threads("/proc/self/task");
  EXPECT_LT(std::distance(threads, {}), 50) << "none of them waits in a thread of its own";
  stubborn.end();
  ASSERT_TRUE(answered(kRemovals));
  EXPECT_EQ(answer_, 0);
}

TEST_F(JobManagerTest, RemovalWaitsForWhatIsJustBeingStartedAndKeepsItFromRunning) {
  const Child host;
  const Child instance;
  ASSERT_EQ(add(host), 0);
  const auto launch = begin(host);
  ASSERT_TRUE(launch);
  remove();
  EXPECT_FALSE(begin(host)) << "the removal is behind us on the queue";
  EXPECT_EQ(answerCount_, 0);
  EXPECT_EQ(jobs_->instanceStarted(launch->instance, instance.pidfd()), EPERM);
  EXPECT_TRUE(jobs_->instances(kIdentifier).empty());
  jobs_->launchFailed(launch->instance);
  ASSERT_TRUE(answered(1));
  EXPECT_EQ(answer_, 0);
}

TEST_F(JobManagerTest, RefusesWhatCannotBeLaunched) {
  const Child host;
  const auto refusal = [&](const std::string& executable, const Value& overlay) {
    return jobs_->jobAddExternalService(host.peer(), executable, overlay);
  };
  const Value overlay = Dictionary{{"IPCService", Dictionary{}}};
  EXPECT_EQ(refusal(bundle_, overlay), ENOEXEC);
  EXPECT_EQ(refusal(bundle_ + "/missing", overlay), ENOEXEC);
  EXPECT_EQ(refusal(bundle_ + "/Info.plist", overlay), ENOEXEC);
  EXPECT_EQ(refusal("/bin/true", overlay), ENOEXEC) << "in no bundle";
  EXPECT_EQ(refusal(executable_, "text"), EINVAL);
  EXPECT_EQ(refusal(executable_, Dictionary{}), EINVAL);
  EXPECT_EQ(add(host, "text"), EINVAL);
  EXPECT_EQ(add(host, Dictionary{{"A=B", "text"}}), EINVAL);
  EXPECT_EQ(add(host, Dictionary{{"", "text"}}), EINVAL);
  EXPECT_EQ(add(host, Dictionary{{"A", Array{}}}), EINVAL);
  Child dead;
  const auto gone = dead.peer();
  dead.end();
  EXPECT_EQ(jobs_->jobAddExternalService(gone, executable_, overlay), ESRCH);
}

TEST_F(JobManagerTest, BusyIsCountedAndTheInstancesOfAHostAreBounded) {
  const Child host;
  const Child instance;
  const std::uint64_t id = start(host, instance);
  const auto assertions = ProcessAssertions::make(jobs_);
  const auto busy = [&] { return assertions->queryBusyInstances({kIdentifier}); };
  EXPECT_EQ(busy().size(), 0U);
  jobs_->setBusy(id, true);
  jobs_->setBusy(id, true);
  jobs_->setBusy(id, false);
  ASSERT_EQ(busy().size(), 1U);
  EXPECT_EQ(busy().at(0)[kBusyBundleIdentifierKey].string(), kIdentifier);
  jobs_->setBusy(id, false);
  EXPECT_EQ(busy().size(), 0U);
  EXPECT_FALSE(jobs_->instanceOf(*host.peer())) << "who shares the daemon's namespace is no instance";

  std::vector<std::uint64_t> places;
  while (const auto launch = begin(host)) places.push_back(launch->instance);
  EXPECT_EQ(refusal_, EAGAIN);
  ASSERT_EQ(places.size(), ProcessJobManager::kInstancesPerHost - 1);
  jobs_->launchFailed(places.front());
  EXPECT_TRUE(begin(host));
}

}  // namespace
}  // namespace platform
