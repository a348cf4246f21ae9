// Plug-ins that really run: made ready and launched through a running daemon, seen from the host, from inside the
// sandbox (tests/support/ProbePlugIn.cpp) and from the outside.
#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/sched.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <set>

#include "Extora/XTHostServices.h"
#include "Extora/XTProtocol.h"
#include "Extora/XTSandboxExtension.h"
#include "platform/hostservices/HostServicesProtocol.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"
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
    fs::permissions(daemon_.root(), fs::perms(0755));
    daemon_.setEnvironment("EXTORA_PROFILES", PROFILES);
    daemon_.setEnvironment("EXTORA_PLUGIN_USER", std::to_string(plugInUser()));
    ::setenv("EXTORA_RUNTIME_DIR", daemon_.runtime().c_str(), 1);
  }

  static uid_t plugInUser() { return ::geteuid() == 0 ? kNobody : ::geteuid(); }
  std::string container() const { return daemon_.state() / "Containers" / kIdentifier; }

  // An application with one probe, whose Info.plist declares these variables, and a daemon that offers it.
  void start(const Dictionary& variables = {}, const std::string& point = "com.example.point") {
    install(variables, point);
    daemon_.start();
    client_ = std::make_unique<tests::Client>(daemon_.runtime(), tests::Daemon::kService);
  }
  void install(const Dictionary& variables, const std::string& point) {
    tests::SampleBundle plugIn = tests::samplePlugIn(kIdentifier, {}, point);
    plugIn.program = PROBE_BINARY;
    plugIn.info.set("IPCService", Dictionary{{"EnvironmentVariables", variables}});
    application_ = tests::installBundle(daemon_.applications(), tests::sampleApplication("com.example.app", {plugIn}));
    bundle_ = application_ + "/PlugIns/probe.appex";
    executable_ = bundle_ + "/plugin";
  }
  Value form() {
    platform::Array forms;
    EXPECT_TRUE(tests::eventually([&] { return (forms = client_->match({})).size() == 1; }));
    return forms.size() == 1 ? forms[0] : Value();
  }
  // "", or why the probe cannot be made ready for the host `client`.
  static std::string readyFor(tests::Client& client, const Value& form) {
    const Value uuid = *platform::Uuid::parse(form["uuid"].string());
    return tests::failureOf(client.request("ready", {{"uuids", platform::Array{uuid}}}));
  }
  std::string ready() { return readyFor(*client_, form()); }
  // The probe, or null and the error in error_.
  std::unique_ptr<Probe> launch() {
    error_ = {};
    auto launched = XTHostServices::launch(executable_, &error_);
    return launched ? std::make_unique<Probe>(std::move(*launched)) : nullptr;
  }
  // Ends all instances of the probe, and waits for it.
  void terminate() {
    const Value hold = client_->request(
        "lock", {{"paths", platform::Array{application_}}, {"flags", std::uint64_t{XTHoldFlagTerminate}}});
    EXPECT_EQ(tests::failureOf(client_->request("lock", {{"uuids", platform::Array{hold["uuids"]}}})), "");
  }
  // The exit status of a program that asks for a launch of the probe.
  int launchElsewhere(const char* how) {
    tests::RunningProgram other({PROBE_BINARY, how, executable_}, daemon_.environment(), STDOUT_FILENO);
    const int status = other.wait();
    elsewhere_ = other.pid();
    said_ = other.output();
    return status;
  }

  tests::Daemon daemon_;
  std::string application_;
  std::string bundle_;
  std::string executable_;
  std::unique_ptr<tests::Client> client_;
  Error error_;
  pid_t elsewhere_ = 0;
  std::string said_;
};

TEST_F(LaunchTest, SeesItsOwnAndTheSystemAndNothingElse) {
  std::ofstream(daemon_.root() / "secret") << "secret";
  fs::permissions(daemon_.root() / "secret", fs::perms(0666));
  start({{"COLOUR", "green"}, {"COUNT", 7}, {"EXTORA_IPC_FD", "8"}});
  ASSERT_EQ(ready(), "");
  const auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  const Value report = probe->ask({{"ask", "report"}});

  EXPECT_EQ(setOf(report["environment"]),
            (std::set<std::string>{"COLOUR=green", "COUNT=7", "EXTORA_IPC_FD=3", "HOME=" + container(),
                                   "HBFIXED_USER_HOME=" + container(), "TMPDIR=" + container() + "/tmp"}));
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
  for (const fs::path& outside : {daemon_.root() / "secret", fs::path("/etc/passwd"), fs::path("/root"),
                                  daemon_.applications() / "app.app/Info.plist", daemon_.state() / "lock"}) {
    EXPECT_EQ(probe->open(outside), ENOENT) << outside;
  }
  const auto socket = [&](const char* service) { return daemon_.socket(service).string(); };
  EXPECT_EQ(probe->result({{"ask", "connect"}, {"path", socket(platform::kHostServices)}}), 0);
  EXPECT_EQ(probe->result({{"ask", "connect"}, {"path", socket(tests::Daemon::kService)}}), ENOENT);
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
  start({}, "com.orvane.keyboard-service");
  ASSERT_EQ(ready(), "");
  const auto confined = launch();
  ASSERT_NE(confined, nullptr) << error_.describe();
  EXPECT_EQ(confined->result(tcp), ECONNREFUSED) << "nobody listens on its own loopback";
  const Value before = form()["uuid"];
  install({}, "com.orvane.app.non-ui-extension");
  ASSERT_TRUE(tests::eventually([&] { return form()["uuid"] != before; }));
  ASSERT_EQ(ready(), "");
  const auto connected = launch();
  ASSERT_NE(connected, nullptr) << error_.describe();
  EXPECT_EQ(connected->result(tcp), 0);
}

TEST_F(LaunchTest, EachExtensionPointHasItsProfileWhichShipsAndSaysWhatItGrants) {
  const std::vector<std::pair<std::string, std::string>> rows = {
      {"com.example.point", "plugin"},
      {"com.orvane.keyboard-service", "keyboard"},
      {"com.orvane.netguard.filter-data", "network-filter"},
      {"com.orvane.glance.extension.preview", "glanced"},
      {"com.orvane.glance.preview", "glance-preview"},
      {"com.orvane.glance.preview.highmemory", "glance-preview"},
      {"com.orvane.glance.thumbnail", "glance-thumbnail"},
      {"com.orvane.glance.thumbnail.highmemory", "glance-thumbnail"},
      {"com.orvane.app.non-ui-extension", "sketchpad-devtools"},
      {"com.orvane.app.non-ui-extension.multiple-instances", "sketchpad-devtools"},
      {"com.orvane.callscreen.message-filter", "message-filter"},
      {"com.orvane.callscreen.classification-ui", "classification-ui"},
  };
  std::vector<tests::SampleBundle> plugIns;
  for (std::size_t i = 0; i < rows.size(); ++i) {
    plugIns.push_back(tests::samplePlugIn("com.example.p" + std::to_string(i), {}, rows[i].first));
    plugIns.back().program = PROBE_BINARY;
  }
  const auto folder = tests::writeBundle(daemon_.applications(), tests::sampleApplication("com.example.all", plugIns));
  daemon_.start();
  auto client = daemon_.connect();
  for (std::size_t i = 0; i < rows.size(); ++i) {
    const auto name = "p" + std::to_string(i);
    const auto& [point, profile] = rows[i];
    const auto forms = client.match({{"HXExtensionIdentifier", "=com.example." + name}});
    ASSERT_EQ(forms.size(), 1U);
    ASSERT_EQ(readyFor(client, forms[0]), "") << point;
    EXPECT_EQ(daemon_.countInLog(forms[0]["uuid"].string() + " to " + profile + " sandbox\n"), 1U) << point;
    executable_ = folder + "/PlugIns/" + name + ".appex/plugin";
    EXPECT_NE(launch(), nullptr) << point << ": " << error_.describe();
    EXPECT_NE(textOf(fs::path(PROFILES) / (profile + ".plist")).find("<key>Description</key>"), std::string::npos);
  }
}

TEST_F(LaunchTest, VariablesOfABundleActOnThePlugInAlone) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the address sanitizer ends a program that has something preloaded before its runtime";
#endif
  constexpr const char* kLibrary = "libBrokenLocale.so.1";
  start({{"LD_PRELOAD", kLibrary}, {"LD_LIBRARY_PATH", "/nowhere"}});
  ASSERT_EQ(ready(), "");
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
  const auto host = daemon_.writeHost("host");
  start();
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, EPERM) << "nobody has been made ready for";
  ASSERT_EQ(ready(), "");
  EXPECT_EQ(launchElsewhere("launch"), EPERM) << "the host's own child";
  EXPECT_NE(launch(), nullptr) << error_.describe();
  terminate();
  tests::Host stranger(daemon_, host);
  ASSERT_EQ(readyFor(stranger, form()), "");
  EXPECT_EQ(launch(), nullptr) << "made ready for somebody else";
  EXPECT_EQ(error_.code, EPERM);

  ASSERT_EQ(launchElsewhere("host"), 0) << "it has been made ready for, and has ended";
  pid_t wanted = elsewhere_;
  struct clone_args arguments = {};
  arguments.exit_signal = SIGCHLD;
  arguments.set_tid = reinterpret_cast<std::uintptr_t>(&wanted);
  arguments.set_tid_size = 1;
  const auto recycled = static_cast<pid_t>(::syscall(SYS_clone3, &arguments, sizeof arguments));
  if (recycled == 0) {
    ::execl(PROBE_BINARY, PROBE_BINARY, "launch", executable_.c_str(), nullptr);
    ::_exit(0);
  }
  if (recycled > 0) {  // else this user may not choose process ids
    int status = 0;
    EXPECT_EQ(::waitpid(recycled, &status, 0), elsewhere_);
    EXPECT_EQ(WEXITSTATUS(status), EPERM) << "another process of the same number";
  }

  ASSERT_EQ(ready(), "");
  tests::removeBundle(application_);
  EXPECT_TRUE(tests::eventually([&] { return launch() == nullptr && error_.code == EPERM; })) << "its bundle has gone";
}

TEST_F(LaunchTest, WhatCannotBeLaunchedIsRefusedWithItsReason) {
  const auto profiles = daemon_.root() / "profiles";
  fs::copy(fs::path(PROFILES) / "plugin.plist", profiles);
  daemon_.setEnvironment("EXTORA_PROFILES", profiles);
  start();
  ASSERT_EQ(ready(), "");
  fs::rename(profiles / "plugin.plist", profiles / "other.plist");
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, ENOENT) << "no profile";
  fs::rename(profiles / "other.plist", profiles / "plugin.plist");
  std::ofstream(executable_, std::fstream::trunc) << "no program";
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, ENOEXEC) << "the kernel's own word";
}

TEST_F(LaunchTest, APlugInNeverRunsAsRoot) {
  daemon_.setEnvironment("EXTORA_PLUGIN_USER", "0");
  start();
  ASSERT_EQ(ready(), "");
  EXPECT_EQ(launch(), nullptr);
  EXPECT_EQ(error_.code, EPERM);
}

TEST_F(LaunchTest, AHoldEndsRunningStubbornAndDeadInstances) {
  daemon_.setEnvironment("EXTORA_TERMINATION_GRACE_MS", "100");
  start();
  ASSERT_EQ(ready(), "");
  const auto willing = launch();
  const auto stubborn = launch();
  const auto dead = launch();
  ASSERT_TRUE(willing && stubborn && dead) << error_.describe();
  ASSERT_EQ(stubborn->result({{"ask", "ignore-term"}}), 0);
  ::kill(dead->pid, SIGKILL);
  ASSERT_EQ(willing->result({{"ask", "nothing"}}), EINVAL) << "it runs";
  terminate();
  EXPECT_TRUE(fs::exists(container() + "/terminated")) << "SIGTERM has reached the plug-in";
  for (const auto* probe : {&willing, &stubborn, &dead}) EXPECT_TRUE(ended((*probe)->pid));
  EXPECT_EQ(launch(), nullptr) << "the registration has ended, too";
  EXPECT_EQ(error_.code, EPERM);
}

TEST_F(LaunchTest, AnInstanceEndsWithItsHostAndWithTheDaemon) {
  start();
  ASSERT_EQ(launchElsewhere("host"), 0) << "it has launched, and has ended";
  EXPECT_TRUE(tests::eventually([&] { return ended(std::stoi(said_)); }));
  ASSERT_EQ(ready(), "");
  const auto probe = launch();
  ASSERT_NE(probe, nullptr) << error_.describe();
  const std::string first = std::to_string(probe->pid);
  const pid_t plugIn = std::stoi(textOf("/proc/" + first + "/task/" + first + "/children"));
  daemon_.process().signal(SIGKILL);
  EXPECT_TRUE(tests::eventually([&] { return ended(probe->pid) && ended(plugIn); }));
}

TEST_F(LaunchTest, ExtensionsAreConsumedOnceAndReleasedByWhoConsumedThem) {
  tests::LogCapture log("debug");
  start();
  const std::string token = form()["extensions"]["."].string();
  {
    XTSandboxExtension extension(token);
    EXPECT_EQ(extension.handle(), -1);
    EXPECT_EQ(extension.descriptor(), -1);
    extension.consume();
    const std::int64_t handle = extension.handle();
    ASSERT_GT(handle, 0);
    extension.consume();
    EXPECT_EQ(extension.handle(), handle) << "once";
    EXPECT_TRUE(UniqueFd(::openat(extension.descriptor(), "Info.plist", O_RDONLY)));
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
  const auto tokenOf = [](const Value& form) { return form["extensions"]["."].string(); };
  const Value first = form();
  const std::string token = tokenOf(first);
  const auto directory = XTHostServices::consume(token, &error_);
  ASSERT_TRUE(directory) << error_.describe();
  EXPECT_TRUE(UniqueFd(::openat(directory->descriptor.get(), "Info.plist", O_RDONLY)));
  EXPECT_LT(::openat(directory->descriptor.get(), "../probe.appex", O_RDONLY), 0);
  EXPECT_LT(::openat(directory->descriptor.get(), "plugin", O_RDWR), 0);
  const auto consumed = XTHostServices::consume(first["service-extension"].string(), &error_);
  ASSERT_TRUE(consumed) << error_.describe();
  EXPECT_FALSE(consumed->descriptor);

  // Handles of other processes are none of this one's business.
  tests::Client other(daemon_.runtime(), platform::kHostServices);
  const auto errnoOf = [&](const Dictionary& request) { return other.send(request)["errno"].exactUnsigned(); };
  EXPECT_EQ(errnoOf({{"operation", "release"}, {"handle", consumed->handle + 1}}), std::uint64_t{EINVAL});
  EXPECT_EQ(errnoOf({{"operation", "conquer"}}), std::uint64_t{EINVAL});
  EXPECT_EQ(errnoOf({{"operation", "release"}, {"handle", consumed->handle}}), 0U) << "of the same process";

  install({}, "com.example.point");
  EXPECT_FALSE(XTHostServices::consume(token, &error_));
  EXPECT_EQ(error_.code, ESTALE) << "its bundle has been replaced";
  ASSERT_TRUE(tests::eventually([&] { return form()["uuid"] != first["uuid"]; }));
  const std::string old = tokenOf(form());
  EXPECT_EQ(daemon_.stop(), 0);
  EXPECT_FALSE(XTHostServices::consume(old, &error_));
  EXPECT_EQ(error_.code, ENOTCONN) << "nobody serves";
  daemon_.start();
  EXPECT_FALSE(XTHostServices::consume(old, &error_));
  EXPECT_EQ(error_.code, EACCES) << "after a restart";
}

TEST_F(LaunchTest, ASecondDaemonInOneRuntimeDirectoryGoesOnWithoutLaunches) {
  start();
  auto environment = daemon_.environment();
  environment["EXTORA_STATE_DIR"] = daemon_.root() / "other-state";
  tests::RunningProgram second({XTD_BINARY, "-S", "com.example.second"}, environment, STDERR_FILENO);
  EXPECT_TRUE(second.waitForOutput("com.orvane.platform is served already"));
  ASSERT_EQ(ready(), "");
  EXPECT_NE(launch(), nullptr) << error_.describe();
}

}  // namespace
}  // namespace extora
