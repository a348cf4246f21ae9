#include <gtest/gtest.h>
#include <linux/sched.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>

#include "platform/assertions/ProcessAssertions.h"
#include "platform/jobs/ProcessJobManager.h"
#include "platform/queue/MainRunLoop.h"
#include "tests/support/FakeRegistry.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

constexpr auto kDeadline = std::chrono::seconds(20);
constexpr const char* kIdle = "exec sleep 1000";
constexpr const char* kIdentifier = "com.example.filter";

// A child process that is ended and reaped with the object.
class Child {
 public:
  explicit Child(const char* script, pid_t wantedPid = 0) {
    struct clone_args arguments = {};
    arguments.exit_signal = SIGCHLD;
    if (wantedPid != 0) {
      arguments.set_tid = reinterpret_cast<std::uintptr_t>(&wantedPid);
      arguments.set_tid_size = 1;
    }
    pid_ = static_cast<pid_t>(::syscall(SYS_clone3, &arguments, sizeof arguments));
    if (pid_ == 0) {
      ::execl("/bin/sh", "sh", "-c", script, nullptr);
      ::_exit(127);
    }
  }
  ~Child() { end(); }
  Child(const Child&) = delete;
  Child& operator=(const Child&) = delete;
  void end() {
    if (pid_ <= 0) return;
    ::kill(pid_, SIGKILL);
    (void)::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }
  pid_t pid() const { return pid_; }
  UniqueFd pidfd() const { return UniqueFd(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0))); }
  std::shared_ptr<const PeerIdentity> identity() const { return PeerIdentity::ofPidfd(pidfd().get()); }
  bool ended() const { return !identity()->isAlive(); }

 private:
  pid_t pid_ = -1;
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
    return jobs_->jobAddExternalService(host.identity(), executable_, Dictionary{{"IPCService", service}});
  }
  // The launch, or nothing and the error number in refusal_.
  std::optional<JobManager::Launch> begin(const Child& host) {
    refusal_ = 0;
    return jobs_->beginLaunch(host.identity(), executable_, &refusal_);
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

TEST_F(JobManagerTest, RemovalEndsInstancesAndAnswersOnce) {
  const Child host(kIdle);
  const Child first(kIdle);
  const Child second(kIdle);
  start(host, first);
  start(host, second);
  remove("2");
  ASSERT_TRUE(answered(1));
  EXPECT_EQ(answer_, JobManager::kNoneOnRecord) << "another version is not on record";
  EXPECT_FALSE(first.ended());

  remove();
  ASSERT_TRUE(answered(2));
  EXPECT_EQ(answer_, 0);
  EXPECT_TRUE(first.ended());
  EXPECT_TRUE(second.ended());
  EXPECT_FALSE(begin(host));
  EXPECT_EQ(refusal_, EPERM);
  remove();
  ASSERT_TRUE(answered(3));
  EXPECT_EQ(answer_, JobManager::kNoneOnRecord);
}

TEST_F(JobManagerTest, ManyRemovalsOfWhatDoesNotEndCostNoThreads) {
  const Child host(kIdle);
  Child stubborn(kIdle);
  ::kill(stubborn.pid(), SIGSTOP);
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
  const Child host(kIdle);
  const Child instance(kIdle);
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

TEST_F(JobManagerTest, RecycledProcessIdOfADeadHostStillEndsItsInstances) {
  const Child instance(kIdle);
  Child host(kIdle);
  start(host, instance);
  const pid_t recycled = host.pid();
  host.end();  // the main loop does not run: nobody has been told
  const Child next(kIdle, recycled);
  if (next.pid() != recycled) GTEST_SKIP() << "this user may not choose process ids";
  EXPECT_FALSE(begin(next));
  ASSERT_EQ(add(next), 0);
  ASSERT_TRUE(runUntil([&] { return jobs_->instances(kIdentifier).empty(); }));
  EXPECT_TRUE(begin(next));
}

TEST_F(JobManagerTest, RefusesWhatCannotBeLaunched) {
  const Child host(kIdle);
  const auto refusal = [&](const std::string& executable, const Value& overlay) {
    return jobs_->jobAddExternalService(host.identity(), executable, overlay);
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
  Child dead(kIdle);
  const auto gone = dead.identity();
  dead.end();
  EXPECT_EQ(jobs_->jobAddExternalService(gone, executable_, overlay), ESRCH);
}

TEST_F(JobManagerTest, EnvironmentIsTextAndTheSecondRegistrationReplacesTheFirst) {
  const Child host(kIdle);
  ASSERT_EQ(add(host), 0);
  ASSERT_EQ(add(host, Dictionary{{"REAL", 1.5}, {"YES", true}, {"COUNT", 7}, {"EXTORA_IPC_FD", "9"}, {"A", "b=c"}}), 0);
  const auto launch = begin(host);
  ASSERT_TRUE(launch);
  EXPECT_EQ(launch->environment,
            (std::vector<std::string>{"A=b=c", "COUNT=7", "EXTORA_IPC_FD=3", "REAL=1.5", "YES=true"}));
  EXPECT_EQ(launch->profile, "plugin");
  EXPECT_EQ(launch->container, std::string("/Containers/") + kIdentifier);
}

TEST_F(JobManagerTest, BusyIsCountedAndTheInstancesOfAHostAreBounded) {
  const Child host(kIdle);
  const Child instance(kIdle);
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
  EXPECT_FALSE(jobs_->instanceOf(*host.identity())) << "who shares the daemon's namespace is no instance";

  std::vector<std::uint64_t> places;
  while (const auto launch = begin(host)) places.push_back(launch->instance);
  EXPECT_EQ(refusal_, EAGAIN);
  ASSERT_EQ(places.size(), ProcessJobManager::kInstancesPerHost - 1);
  jobs_->launchFailed(places.front());
  EXPECT_TRUE(begin(host));
}

}  // namespace
}  // namespace platform
