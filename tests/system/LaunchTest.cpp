// Plug-ins that really run: launched by the platform's host services, seen from the host, from inside the sandbox
// (tests/support/ProbePlugIn.cpp) and from the outside. The daemon is tests/system/LaunchDaemon.cpp.
#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <set>
#include <thread>

#include "Extora/XTHostServices.h"
#include "Extora/XTSandboxExtension.h"
#include "platform/hostservices/HostServicesProtocol.h"
#include "tests/support/Daemon.h"
#include "tests/support/LogCapture.h"
#include "tests/support/SampleBundles.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::UniqueFd;
using platform::Value;

constexpr const char* kIdentifier = "com.example.probe";
constexpr uid_t kNobody = 65534;

std::string textOf(const fs::path& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

// The rest of the line of /proc/<pid>/status that begins with `key`.
std::string statusOf(const std::string& status, const std::string& key) {
  const auto begin = status.find(key + ":\t");
  if (begin == std::string::npos) return "none";
  const auto from = begin + key.size() + 2;
  return status.substr(from, status.find('\n', from) - from);
}

std::set<std::string> setOf(const Value& array) {
  std::set<std::string> all;
  for (const Value& each : array.items()) all.insert(each.string());
  return all;
}

bool ended(pid_t pid) {
  const UniqueFd pidfd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  return !pidfd || !platform::PeerIdentity::ofPidfd(pidfd.get())->isAlive();
}

bool waitFor(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + tests::kDeadline;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

// A launched probe and the host's connection to it.
class Probe {
 public:
  explicit Probe(XTHostServices::Launched launched)
      : pid(launched.pid), connection_(platform::ipcConnectionOverSocket(std::move(launched.connection), queue_)) {
    connection_->setEventHandler([](const platform::IpcEvent&) {});
    connection_->resume();
  }
  Value ask(Dictionary request) { return connection_->sendWithReplySync(request).body; }
  // The error number that the probe got; -1 when it did not answer.
  std::int64_t result(Dictionary request) {
    const Value reply = ask(std::move(request));
    return reply["errno"] ? reply["errno"].integerValue() : -1;
  }
  std::int64_t open(const std::string& path, int flags = O_RDONLY) {
    return result({{"ask", "open"}, {"path", path}, {"flags", flags}});
  }

  const pid_t pid;

 private:
  platform::SerialQueue queue_{"probe"};
  std::shared_ptr<platform::IpcConnection> connection_;
};

class LaunchTest : public testing::Test {
 protected:
  LaunchTest() {
    // Whoever plug-ins run as must be able to reach what is theirs.
    fs::permissions(place_.root(), fs::perms(0755));
    place_.setEnvironment("EXTORA_PROFILES", PROFILES);
    place_.setEnvironment("EXTORA_PLUGIN_USER", std::to_string(plugInUser()));
    ::setenv("EXTORA_RUNTIME_DIR", place_.runtime().c_str(), 1);
    tests::SampleBundle plugIn = tests::samplePlugIn(kIdentifier);
    plugIn.program = PROBE_BINARY;
    bundle_ =
        tests::installBundle(place_.applications(), tests::sampleApplication("com.example.app", {std::move(plugIn)})) +
        "/PlugIns/probe.appex";
    executable_ = bundle_ + "/plugin";
  }
  ~LaunchTest() override {
    if (daemon_ != nullptr && testing::Test::HasFailure()) std::cerr << daemon_->output();
  }

  static uid_t plugInUser() { return ::geteuid() == 0 ? kNobody : ::geteuid(); }
  std::string container() const { return place_.state() / "Containers" / kIdentifier; }

  void start() {
    daemon_ = std::make_unique<tests::RunningProgram>(std::vector<std::string>{DAEMON_BINARY}, place_.environment(),
                                                      STDERR_FILENO);
    ASSERT_TRUE(daemon_->waitForOutput("serving"));
    xtd_ = std::make_unique<tests::Client>(place_.runtime(), "com.example.launches");
  }

  int ready(Dictionary variables = {}, const std::string& profile = "plugin", pid_t host = 0) {
    variables.set("HOME", container());
    const Dictionary service{{"EnvironmentVariables", variables}, {"_SandboxProfile", profile}};
    Dictionary request{{"ask", "ready"}, {"executable", executable_}, {"overlay", Dictionary{{"IPCService", service}}}};
    if (host != 0) request.set("pid", host);
    return static_cast<int>(xtd_->send(request)["result"].integerValue());
  }
  // The probe, or null and the error in error_.
  std::unique_ptr<Probe> launch() {
    error_ = {};
    auto launched = XTHostServices::launch(executable_, &error_);
    return launched ? std::make_unique<Probe>(std::move(*launched)) : nullptr;
  }
  std::int64_t remove() {
    return xtd_->send({{"ask", "remove"}, {"identifier", kIdentifier}, {"version", "1"}})["result"].integerValue();
  }
  Value instances() { return xtd_->send({{"ask", "instances"}, {"identifier", kIdentifier}}); }
  bool isBusy() { return instances()["busy"].size() != 0; }
  std::string issue(const std::string& path) {
    return xtd_->send({{"ask", "issue"}, {"path", path}, {"boundary", bundle_}})["token"].string();
  }

  tests::Daemon place_;  // its folders; no xtd is started
  std::string bundle_;
  std::string executable_;
  std::unique_ptr<tests::RunningProgram> daemon_;
  std::unique_ptr<tests::Client> xtd_;
  Error error_;
};

TEST_F(LaunchTest, SeesItsOwnAndTheSystemAndNothingElse) {
  std::ofstream(place_.root() / "secret") << "secret";
  fs::permissions(place_.root() / "secret", fs::perms(0666));
  start();
  ASSERT_EQ(ready({{"COLOUR", "green"}, {"COUNT", 7}, {"EXTORA_IPC_FD", "8"}}), 0);
  const auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  const Value report = probe->ask({{"ask", "report"}});

  EXPECT_EQ(setOf(report["environment"]),
            (std::set<std::string>{"COLOUR=green", "COUNT=7", "EXTORA_IPC_FD=3", "HOME=" + container()}));
  const auto descriptors = setOf(report["descriptors"]);
  EXPECT_EQ(descriptors.size(), 4U) << report["descriptors"].describe();
  for (const char* number : {"0", "1", "2"}) EXPECT_EQ(descriptors.count(std::string(number) + " /dev/null"), 1U);
  EXPECT_TRUE(std::any_of(descriptors.begin(), descriptors.end(),
                          [](const std::string& each) { return each.starts_with("3 socket:"); }));
  EXPECT_EQ(report["processes"].size(), 2U) << "itself and the sandbox's first process";
  EXPECT_EQ(report["first"].string(), "") << "which is none of its business";
  EXPECT_EQ(setOf(report["interfaces"]), std::set<std::string>{"lo"});
  EXPECT_EQ(report["uid"].integerValue(), plugInUser());
  EXPECT_EQ(report["session"].integerValue(), 1) << "its sandbox's own";
  const std::string& status = report["status"].string();
  for (const char* set : {"CapInh", "CapPrm", "CapEff", "CapBnd", "CapAmb"}) {
    EXPECT_EQ(statusOf(status, set), "0000000000000000") << set;
  }
  EXPECT_EQ(statusOf(status, "NoNewPrivs"), "1");
  EXPECT_EQ(statusOf(status, "SigBlk"), "0000000000000000");
  EXPECT_EQ(statusOf(status, "SigIgn"), "0000000000000000");
  EXPECT_NE(probe->result({{"ask", "user-namespace"}}), 0);

  const int create = O_WRONLY | O_CREAT;
  EXPECT_EQ(probe->open(executable_), 0);
  EXPECT_EQ(probe->open(bundle_ + "/new", create), EROFS);
  EXPECT_EQ(probe->open("/usr/new", create), EROFS);
  EXPECT_EQ(probe->open("/new", create), EROFS);
  EXPECT_EQ(probe->open(container() + "/new", create), 0);
  EXPECT_TRUE(fs::exists(container() + "/new"));
  EXPECT_EQ(probe->open("/tmp/extora-probe", create), 0);
  EXPECT_FALSE(fs::exists("/tmp/extora-probe")) << "its /tmp is private";
  for (const fs::path& outside : {place_.root() / "secret", fs::path("/etc/passwd"), fs::path("/root"),
                                  place_.applications() / "app.app/Info.plist", place_.state() / "lock"}) {
    EXPECT_EQ(probe->open(outside), ENOENT) << outside;
  }
  const auto socket = [&](const char* service) { return place_.socket(service).string(); };
  EXPECT_EQ(probe->result({{"ask", "connect"}, {"path", socket(platform::kHostServices)}}), 0);
  EXPECT_EQ(probe->result({{"ask", "connect"}, {"path", socket("com.example.launches")}}), ENOENT);
}

TEST_F(LaunchTest, NetworkIsThereForProfilesThatGrantIt) {
  const UniqueFd server(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  ASSERT_EQ(::bind(server.get(), reinterpret_cast<sockaddr*>(&address), size), 0);
  ASSERT_EQ(::listen(server.get(), 4), 0);
  ASSERT_EQ(::getsockname(server.get(), reinterpret_cast<sockaddr*>(&address), &size), 0);
  const Dictionary tcp{{"ask", "tcp"}, {"port", ntohs(address.sin_port)}};
  start();
  ASSERT_EQ(ready({}, "keyboard"), 0);
  const auto confined = launch();
  ASSERT_NE(confined, nullptr) << error_.describe();
  EXPECT_EQ(confined->result(tcp), ECONNREFUSED) << "nobody listens on its own loopback";
  ASSERT_EQ(ready({}, "sketchpad-devtools"), 0);
  const auto connected = launch();
  ASSERT_NE(connected, nullptr) << error_.describe();
  EXPECT_EQ(connected->result(tcp), 0);
}

TEST_F(LaunchTest, EveryProfileOfTheTableShipsAndSaysWhatItGrants) {
  start();
  for (const char* name : {"plugin", "keyboard", "network-filter", "glanced", "glance-preview", "glance-thumbnail",
                           "sketchpad-devtools", "message-filter", "classification-ui"}) {
    ASSERT_EQ(ready({}, name), 0);
    EXPECT_NE(launch(), nullptr) << name << ": " << error_.describe();
    EXPECT_NE(textOf(fs::path(PROFILES) / (std::string(name) + ".plist")).find("<key>Description</key>"),
              std::string::npos)
        << name;
  }
}

TEST_F(LaunchTest, VariablesOfABundleActOnThePlugInAlone) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the address sanitizer ends a program that has something preloaded before its runtime";
#endif
  constexpr const char* kLibrary = "libBrokenLocale.so.1";
  start();
  ASSERT_EQ(ready({{"LD_PRELOAD", kLibrary}, {"LD_LIBRARY_PATH", bundle_}}), 0);
  const auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  EXPECT_NE(probe->ask({{"ask", "report"}})["libraries"].string().find(kLibrary), std::string::npos);

  const fs::path first = fs::path("/proc") / std::to_string(probe->pid);
  const fs::path bubblewrap = fs::path("/proc") / statusOf(textOf(first / "status"), "PPid");
  EXPECT_EQ(statusOf(textOf(first / "status"), "Name"), "7") << "executed from its descriptor";
  EXPECT_EQ(statusOf(textOf(bubblewrap / "status"), "Name"), "bwrap");
  for (const fs::path& process : {first, bubblewrap}) {
    EXPECT_EQ(textOf(process / "environ").find("LD_"), std::string::npos);
    EXPECT_EQ(textOf(process / "maps").find(kLibrary), std::string::npos);
    EXPECT_EQ(textOf(process / "cmdline").find("LD_"), std::string::npos);
  }
  EXPECT_EQ(textOf(bubblewrap / "environ"), "");
  EXPECT_EQ(statusOf(textOf(bubblewrap / "status"), "Uid").substr(0, 5), std::to_string(plugInUser()).substr(0, 5));
}

TEST_F(LaunchTest, OnlyTheVeryProcessThatWasMadeReadyForMayLaunch) {
  start();
  const auto launchElsewhere = [&] {
    tests::RunningProgram other({PROBE_BINARY, "launch", executable_}, place_.environment(), STDOUT_FILENO);
    return other.wait();
  };
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, EPERM) << "nobody has been made ready for";
  ASSERT_EQ(ready(), 0);
  EXPECT_EQ(launchElsewhere(), EPERM) << "the host's own child";
  EXPECT_NE(launch(), nullptr) << error_.describe();

  ASSERT_EQ(remove(), 0);
  tests::RunningProgram stranger({"/bin/sleep", "1000"}, {}, STDOUT_FILENO);
  ASSERT_EQ(ready({}, "plugin", stranger.pid()), 0);
  EXPECT_EQ(launch(), nullptr) << "made ready for somebody else";
  EXPECT_EQ(error_.code, EPERM);

  ASSERT_EQ(ready(), 0);
  tests::removeBundle(place_.applications() / "app.app");
  EXPECT_TRUE(waitFor([&] { return launch() == nullptr && error_.code == EPERM; })) << "its bundle has gone";
}

TEST_F(LaunchTest, WhatCannotBeLaunchedIsRefusedWithItsReason) {
  start();
  ASSERT_EQ(ready({}, "no-such-profile"), 0);
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, ENOENT);
  ASSERT_EQ(ready(), 0);
  std::ofstream(executable_, std::fstream::trunc) << "no program";
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, ENOEXEC) << "the kernel's own word";
  EXPECT_TRUE(waitFor([&] { return instances()["pids"].size() == 0; }));
}

TEST_F(LaunchTest, APlugInNeverRunsAsRoot) {
  place_.setEnvironment("EXTORA_PLUGIN_USER", "0");
  start();
  ASSERT_EQ(ready(), 0);
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, EPERM);
}

TEST_F(LaunchTest, RemovalEndsRunningStubbornAndDeadInstances) {
  place_.setEnvironment("EXTORA_TERMINATION_GRACE_MS", "100");
  start();
  ASSERT_EQ(ready(), 0);
  const auto willing = launch();
  const auto stubborn = launch();
  const auto dead = launch();
  ASSERT_TRUE(willing && stubborn && dead) << error_.describe();
  ASSERT_EQ(stubborn->result({{"ask", "ignore-term"}}), 0);
  ::kill(dead->pid, SIGKILL);
  ASSERT_EQ(willing->result({{"ask", "nothing"}}), EINVAL) << "it runs";
  EXPECT_EQ(remove(), 0);
  EXPECT_TRUE(fs::exists(container() + "/terminated")) << "SIGTERM has reached the plug-in";
  for (const auto* probe : {&willing, &stubborn, &dead}) EXPECT_TRUE(ended((*probe)->pid));
  EXPECT_EQ(instances()["pids"].size(), 0U);
  EXPECT_EQ(remove(), 3);
}

TEST_F(LaunchTest, AnInstanceEndsWithItsHost) {
  start();
  tests::RunningProgram host({PROBE_BINARY, "launch-when-ready", executable_}, place_.environment(), STDOUT_FILENO);
  ASSERT_EQ(ready({}, "plugin", host.pid()), 0);
  ASSERT_EQ(host.wait(), 0) << "it has launched, and has ended";
  const pid_t first = std::stoi(host.output());
  EXPECT_TRUE(waitFor([&] { return ended(first) && instances()["pids"].size() == 0; }));
}

TEST_F(LaunchTest, ADeadDaemonLeavesNoInstance) {
  start();
  ASSERT_EQ(ready(), 0);
  const auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  const std::string first = std::to_string(probe->pid);
  const pid_t plugIn = std::stoi(textOf("/proc/" + first + "/task/" + first + "/children"));
  daemon_->signal(SIGKILL);
  EXPECT_TRUE(waitFor([&] { return ended(probe->pid) && ended(plugIn); }));
}

TEST_F(LaunchTest, BusyIsWhatAnInstanceSaysUntilItEndsItOrItself) {
  start();
  const Dictionary runtime{{"EXTORA_RUNTIME_DIR", place_.runtime().string()}};
  ASSERT_EQ(ready(runtime), 0);
  auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  EXPECT_FALSE(isBusy());
  ASSERT_EQ(probe->result({{"ask", "begin"}}), 0);
  EXPECT_TRUE(isBusy());
  ASSERT_EQ(probe->result({{"ask", "end"}}), 0);
  EXPECT_FALSE(isBusy());
  ASSERT_EQ(probe->result({{"ask", "begin"}}), 0);
  EXPECT_TRUE(isBusy());
  ::kill(probe->pid, SIGKILL);
  EXPECT_TRUE(waitFor([&] { return !isBusy(); }));

  const auto refusal = XTHostServices::beginActivity();
  ASSERT_TRUE(refusal);
  EXPECT_EQ(refusal->code, EPERM) << "a host is no instance";
}

TEST_F(LaunchTest, ExtensionsAreConsumedOnceAndReleasedByWhoConsumedThem) {
  tests::LogCapture log("debug");
  start();
  const std::string token = issue(bundle_ + "/Info.plist");
  {
    XTSandboxExtension extension(token);
    EXPECT_EQ(extension.handle(), -1);
    EXPECT_EQ(extension.descriptor(), -1);
    extension.consume();
    const std::int64_t handle = extension.handle();
    ASSERT_GT(handle, 0);
    extension.consume();
    EXPECT_EQ(extension.handle(), handle) << "once";
    char head[5] = {};
    EXPECT_EQ(::read(extension.descriptor(), head, 5), 5);
    EXPECT_EQ(std::string(head, 5), textOf(bundle_ + "/Info.plist").substr(0, 5));
    EXPECT_TRUE(extension.isEqual(XTSandboxExtension(token)));
    EXPECT_FALSE(XTHostServices::release(handle)) << "behind its back";
    extension.expel();
    EXPECT_EQ(extension.handle(), -1);
    EXPECT_EQ(extension.descriptor(), -1);
    extension.consume();
  }
  std::string other = token;
  other[0] = token[0] == '0' ? '1' : '0';
  XTSandboxExtension forged(other);
  forged.consume();
  EXPECT_EQ(forged.handle(), -1);

  std::vector<std::string> lines = log.take();
  std::erase_if(lines, [](const std::string& line) { return line.find(" sandbox: ") == std::string::npos; });
  const std::string shown = token.substr(0, 8);
  EXPECT_EQ(lines, (std::vector<std::string>{
                       "DEBUG sandbox: consuming extension " + shown + " -> 1",
                       "DEFAULT sandbox: failed to release extension 1 - errno=22",
                       "DEBUG sandbox: consuming extension " + shown + " -> 2", "DEBUG sandbox: releasing extension 2",
                       "DEFAULT sandbox: failed to consume extension " + other.substr(0, 8) + " - errno=13"}));
}

TEST_F(LaunchTest, TokensAreWorthWhatTheDaemonThatIssuedThemSays) {
  start();
  const auto directory = XTHostServices::consume(issue(bundle_), &error_);
  ASSERT_TRUE(directory) << error_.describe();
  const UniqueFd plist(::openat(directory->descriptor.get(), "Info.plist", O_RDONLY));
  EXPECT_TRUE(plist);
  EXPECT_LT(::openat(directory->descriptor.get(), "../probe.appex", O_RDONLY), 0);
  EXPECT_LT(::openat(directory->descriptor.get(), "plugin", O_RDWR), 0);

  const auto service = [&](const char* extensionClass) {
    return xtd_->send({{"ask", "issue-service"}, {"class", extensionClass}, {"name", kIdentifier}})["token"].string();
  };
  const auto consumed = XTHostServices::consume(service("com.orvane.extora.plugin-service"), &error_);
  ASSERT_TRUE(consumed) << error_.describe();
  EXPECT_FALSE(consumed->descriptor);
  EXPECT_FALSE(XTHostServices::consume(service("com.example.other"), &error_));
  EXPECT_EQ(error_.code, EACCES) << "of a class that nobody serves";

  // Handles of other processes are none of this one's business.
  tests::Client other(place_.runtime(), platform::kHostServices);
  EXPECT_EQ(other.send({{"operation", "release"}, {"handle", consumed->handle + 1}})["errno"].exactUnsigned(),
            static_cast<std::uint64_t>(EINVAL));
  EXPECT_EQ(other.send({{"operation", "conquer"}})["errno"].exactUnsigned(), static_cast<std::uint64_t>(EINVAL));
  EXPECT_EQ(other.send({{"operation", "release"}, {"handle", consumed->handle}}).size(), 0U) << "of the same process";

  const std::string place = bundle_ + "/Info.plist";
  const std::string stale = issue(place);
  fs::rename(place, place + ".old");
  fs::copy_file(place + ".old", place);
  EXPECT_FALSE(XTHostServices::consume(stale, &error_));
  EXPECT_EQ(error_.code, ESTALE);
  const std::string old = issue(place);
  daemon_->signal(SIGTERM);
  EXPECT_EQ(daemon_->wait(), 0);
  start();
  EXPECT_FALSE(XTHostServices::consume(old, &error_));
  EXPECT_EQ(error_.code, EACCES) << "after a restart";
  daemon_->signal(SIGTERM);
  EXPECT_EQ(daemon_->wait(), 0);
  EXPECT_FALSE(XTHostServices::consume(old, &error_));
  EXPECT_EQ(error_.code, ENOTCONN) << "nobody serves";
}

TEST_F(LaunchTest, ASecondDaemonInOneRuntimeDirectoryGoesOnWithoutLaunches) {
  start();
  auto environment = place_.environment();
  environment["EXTORA_STATE_DIR"] = place_.root() / "other-state";
  tests::RunningProgram second({DAEMON_BINARY}, environment, STDERR_FILENO);
  EXPECT_TRUE(second.waitForOutput("com.orvane.platform is served already"));
  ASSERT_EQ(ready(), 0);
  EXPECT_NE(launch(), nullptr) << error_.describe();
}

}  // namespace
}  // namespace extora
