#include "platform/hostservices/Launcher.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <future>

#include "platform/hostservices/LaunchProfile.h"
#include "platform/hostservices/SandboxOptions.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

// Knows only which launches have failed.
class FailureList : public JobManager {
 public:
  int jobAddExternalService(const std::shared_ptr<const PeerIdentity>&, const std::string&, const Value&) override {
    return 0;
  }
  void jobRemoveExternalService(const std::string&, const std::string&, std::shared_ptr<SerialQueue>,
                                std::function<void(int)>) override {}
  std::vector<Instance> instances(const std::string&) override { return {}; }
  void endAll() override {}
  void launchFailed(std::uint64_t instance) override { failed.push_back(instance); }
  std::vector<std::uint64_t> failed;
};

class LauncherTest : public testing::Test {
 protected:
  void write(const std::string& name, const std::string& content) const {
    std::ofstream(directory_.path(name)) << content;
    std::filesystem::permissions(directory_.path(name), std::filesystem::perms::owner_all);
  }
  Launcher::Outcome launch(const Launcher::Programs& programs) {
    Launcher launcher(jobs_, programs);
    std::promise<Launcher::Outcome> outcome;
    Launcher::Order order;
    order.launch.instance = 7;
    launcher.launch(std::move(order), [&](Launcher::Outcome result) { outcome.set_value(std::move(result)); });
    return outcome.get_future().get();
  }
  std::string options(const LaunchProfile& profile) const {
    JobManager::Launch launch;
    launch.bundle = "/Apps/A.app/PlugIns/P.appex";
    launch.container = "/state/Containers/p";
    std::string text = sandboxOptions(launch, profile, "/run/socket");
    for (char& c : text) c = c == '\0' ? ' ' : c;
    return text;
  }

  tests::TemporaryDirectory directory_;
  std::shared_ptr<FailureList> jobs_ = std::make_shared<FailureList>();
};

TEST_F(LauncherTest, WithoutItsProgramsNothingIsLaunched) {
  const std::string nothing = directory_.path("nothing");
  EXPECT_EQ(launch({nothing, {"/bin/true"}}).errorNumber, ENOENT);
  EXPECT_EQ(launch({"/usr/bin/bwrap", {nothing, nothing}}).errorNumber, ENOENT);
  EXPECT_EQ(jobs_->failed, (std::vector<std::uint64_t>{7, 7})) << "told before the outcome";
}

TEST_F(LauncherTest, AFailureOfBubblewrapSaysWhatItSaid) {
  write("complains", "#!/bin/sh\necho 'no namespaces' >&2\nexit 1\n");
  const auto complained = launch({directory_.path("complains"), {"/bin/true"}});
  EXPECT_EQ(complained.errorNumber, EIO);
  EXPECT_NE(complained.reason.find("no namespaces"), std::string::npos);
  write("unreadable", "no program");
  EXPECT_EQ(launch({directory_.path("unreadable"), {"/bin/true"}}).errorNumber, EIO);
  write("talks", "#!/bin/sh\necho g >&4\nexec sleep 1000\n");
  EXPECT_EQ(launch({directory_.path("talks"), {"/bin/true"}}).errorNumber, EIO) << "not the first process's word";
}

TEST_F(LauncherTest, ProfilesThatAreNoneAreRefused) {
  Error error;
  const auto refusal = [&](const char* content) {
    write("p.plist", std::string("<plist version=\"1.0\">") + content + "</plist>");
    return LaunchProfile::read(directory_.path(), "p", &error) ? 0 : error.code;
  };
  EXPECT_EQ(refusal("<dict/>"), 0);
  EXPECT_EQ(refusal("<array/>"), EINVAL);
  EXPECT_EQ(refusal("<dict>"), EINVAL);
  EXPECT_EQ(refusal("<dict><key>Network</key><string>yes</string></dict>"), EINVAL);
  EXPECT_EQ(refusal("<dict><key>ReadOnly</key><string>/etc</string></dict>"), EINVAL);
  EXPECT_EQ(refusal("<dict><key>Writable</key><array><string>etc</string></array></dict>"), EINVAL);
  EXPECT_FALSE(LaunchProfile::read(directory_.path(), "../p", &error));
  EXPECT_EQ(error.code, EINVAL);
  EXPECT_FALSE(LaunchProfile::read(directory_.path(), "q", &error));
  EXPECT_EQ(error.code, ENOENT);
}

TEST_F(LauncherTest, WhatAProfileNamesMayBeBoundAlready) {
  LaunchProfile profile;
  EXPECT_NE(options(profile).find("--unshare-net "), std::string::npos);
  profile.network = true;
  EXPECT_EQ(options(profile).find("--unshare-net "), std::string::npos);
  profile.readOnly = {"/tmp/inside", "/", "/state"};
  profile.writable = {"/Apps/A.app/PlugIns/P.appex"};
  const std::string text = options(profile);
  std::size_t at = 0;
  for (const char* next :
       {"--ro-bind-try / / ", "--bind-try /Apps/A.app/PlugIns/P.appex ", "--ro-bind /Apps/A.app/PlugIns/P.appex ",
        "--ro-bind-try /state /state ", "--bind /state/Containers/p ", "--tmpfs /tmp ", "--ro-bind-try /tmp/inside ",
        "--ro-bind /usr /usr ", "--remount-ro / "}) {
    const std::size_t place = text.find(next, at);
    ASSERT_NE(place, std::string::npos) << next << "in its order in " << text;
    at = place;
  }
}

}  // namespace
}  // namespace platform
