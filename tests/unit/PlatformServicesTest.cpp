// The small services that keep files below the instance's directories: preferences, notifications, containers, locale,
// bundles, and the directories themselves.
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <chrono>
#include <filesystem>
#include <fstream>

#include "platform/container/Containers.h"
#include "platform/files/PosixFiles.h"
#include "platform/locale/Locale.h"
#include "platform/notify/Notifications.h"
#include "platform/preferences/Preferences.h"
#include "platform/queue/MainRunLoop.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using Strings = std::vector<std::string>;

std::string propertyList(const std::string& body) {
  return R"(<plist version="1.0">)" + body + "</plist>";
}

void write(const std::string& path, const std::string& text) {
  std::ofstream(path) << text;
}

struct stat statusOf(const std::string& path) {
  struct stat status {};
  (void)::lstat(path.c_str(), &status);
  return status;
}

mode_t modeOf(const std::string& path) {
  return statusOf(path).st_mode & 07777U;
}

// Runs the main loop until the condition holds or 20 seconds have passed; answers the condition.
bool runUntil(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  bool over = false;  // one stop a wait: a second one would end the next wait's run
  const auto timer = MainRunLoop::main().addTimer(2, [&] {
    if (over || !(condition() || std::chrono::steady_clock::now() > deadline)) return;
    over = true;
    MainRunLoop::main().stop();
  });
  while (!over) MainRunLoop::main().run();
  return condition();
}

class PlatformServicesTest : public testing::Test {
 protected:
  PlatformServicesTest() {
    directories_.runtime = directory_.path("run");
    directories_.state = directory_.path("state");
    directories_.config = directory_.path("config");
  }
  tests::TemporaryDirectory directory_;
  Directories directories_;
};

TEST_F(PlatformServicesTest, PreferencesNeverAnswerWhatAFileHeldBefore) {
  fs::create_directories(directories_.config + "/preferences");
  const std::string path = directories_.config + "/preferences/com.example.plist";
  const auto preferences = Preferences::make(directories_);
  EXPECT_TRUE(preferences->preferenceValue("com.example", "key").isNothing());
  // In place, of equal size, faster than the clock of the file system ticks.
  for (int i = 100; i < 400; ++i) {
    write(path, propertyList(fmt::format("<dict><key>key</key><integer>{}</integer></dict>", i)));
    ASSERT_EQ(preferences->preferenceValue("com.example", "key"), Value(i));
  }
  const auto read = [&] { return preferences->preferenceValue("com.example", "key"); };
  for (const char* text : {"one", "two"}) {
    write(path, propertyList(fmt::format("<dict><key>key</key><string>{}</string></dict>", text)));
    EXPECT_EQ(read(), Value(text));
    ASSERT_TRUE(runUntil([&] { return read().identicalTo(read()); })) << "a file that has settled is parsed once";
  }
  fs::remove(path);
  EXPECT_TRUE(read().isNothing());
  write(directories_.config + "/outside.plist", propertyList("<dict><key>key</key><true/></dict>"));
  EXPECT_TRUE(preferences->preferenceValue("../outside", "key").isNothing());
}

TEST_F(PlatformServicesTest, NoPostOfSeveralProcessesIsLost) {
  constexpr int kProcesses = 4;
  constexpr int kPosts = 300;
  const auto notifications = Notifications::make(directories_);
  EXPECT_EQ(notifications->counter("com.example.change"), std::nullopt);
  const mode_t umask = ::umask(077);
  notifications->prepare("com.example.change");
  ::umask(umask);
  EXPECT_EQ(notifications->counter("com.example.change"), 0U);
  std::vector<pid_t> processes;
  for (int i = 0; i < kProcesses; ++i) {
    processes.push_back(::fork());
    if (processes.back() != 0) continue;
    for (int n = 0; n < kPosts; ++n) notifications->postNotification("com.example.change");
    ::_exit(0);
  }
  for (const pid_t process : processes) ::waitpid(process, nullptr, 0);
  notifications->prepare("com.example.change");
  EXPECT_EQ(notifications->counter("com.example.change"), kProcesses * kPosts);

  const std::string path = directories_.runtime + "/notify/com.example.change";
  EXPECT_EQ(modeOf(path), 0644U);
  std::ifstream file(path, std::fstream::binary);
  const std::string bytes((std::istreambuf_iterator<char>(file)), {});
  EXPECT_EQ(bytes, std::string("\xB0\x04\0\0\0\0\0\0", 8)) << "1,200, little-endian";
}

TEST_F(PlatformServicesTest, ContainersBelongToThoseTheyAreFor) {
  directories_.plugInUser = "12345";
  const auto containers = Containers::make(directories_, Files::make());
  const mode_t umask = ::umask(077);
  const auto own = containers->containerCreateOrLookup(kDaemonContainerClass, kDaemonContainer, 1);
  const auto plugIn = containers->containerCreateOrLookup(kPlugInContainerClass, "com.example.filter@2", 0);
  ::umask(umask);
  ASSERT_EQ(own, (std::variant<std::string, std::uint64_t>(directories_.state + "/Containers/com.orvane.xtd")));
  ASSERT_EQ(plugIn.index(), 0U);
  const std::string path = std::get<0>(plugIn);
  EXPECT_EQ(modeOf(directories_.state + "/Containers"), 0711U);
  const uid_t user = ::geteuid() == 0 ? 12345 : ::geteuid();
  for (const std::string& place : {path, path + "/tmp"}) {
    EXPECT_EQ(modeOf(place), 0700U);
    EXPECT_EQ(statusOf(place).st_uid, user);
  }
  EXPECT_EQ(statusOf(std::get<0>(own)).st_uid, ::geteuid());
  EXPECT_FALSE(fs::exists(std::get<0>(own) + "/tmp"));

  // Its owner put a link to something of the daemon's where tmp was.
  fs::remove(path + "/tmp");
  fs::create_directory_symlink(std::get<0>(own), path + "/tmp");
  EXPECT_EQ(containers->containerCreateOrLookup(kPlugInContainerClass, "com.example.filter@2", 0), plugIn);
  EXPECT_EQ(statusOf(std::get<0>(own)).st_uid, ::geteuid());

  for (const char* bad : {"", ".", "..", "a/b", "-a", "@2", "a@", "a@x", "a@2@3", "../a@2"}) {
    EXPECT_EQ(containers->containerCreateOrLookup(kPlugInContainerClass, bad, 0).index(), 1U) << bad;
  }
  EXPECT_EQ(std::get<1>(containers->containerCreateOrLookup(kDaemonContainerClass, "a@2", 0)), std::uint64_t{EINVAL});
}

TEST_F(PlatformServicesTest, TheLocaleFollowsItsFileHoweverItChanges) {
  ::setenv("LANG", "fr_FR.UTF-8", 1);
  const std::string file = directories_.config + "/locale.conf";
  const auto locale = Locale::make(directories_);
  EXPECT_EQ(locale->current(), "fr_FR.UTF-8");
  std::string told;
  const auto first = locale->observe([&] { told += "1"; });
  auto second = locale->observe([&] { told += "2"; });
  locale->startWatching();
  const auto becomes = [&](const std::string& lang) { return runUntil([&] { return locale->current() == lang; }); };
  const auto replace = [&](const std::string& text) {
    write(directory_.path("new"), text);
    fs::rename(directory_.path("new"), file);
  };

  fs::create_directories(directories_.config);
  replace("# comment\nLC_ALL=C\nLANG=de_CH.UTF-8\n");
  EXPECT_TRUE(becomes("de_CH.UTF-8")) << "the folder came later";
  told.clear();
  replace(" LANG=\"it_IT.UTF-8\" \r\n");
  EXPECT_TRUE(becomes("it_IT.UTF-8")) << "replaced";
  write(file, "LANG='en'\n");
  EXPECT_TRUE(becomes("en")) << "written in place";
  replace("LANG=en\nLC_TIME=C\n");
  second.reset();
  fs::remove(file);
  EXPECT_TRUE(becomes("fr_FR.UTF-8")) << "deleted";
  write(directory_.path("target"), "LANG=ja_JP\n");
  fs::create_symlink(directory_.path("target"), file);
  EXPECT_TRUE(becomes("ja_JP")) << "a link";
  write(directory_.path("target"), "LANG=ko_KR\n");
  EXPECT_TRUE(becomes("ko_KR")) << "behind the link";
  write(directory_.path("next"), "LC_TIME=C\n");
  fs::rename(directory_.path("next"), directory_.path("target"));
  EXPECT_TRUE(becomes("")) << "replaced behind the link, without LANG";
  EXPECT_EQ(told, "12121111") << "in order, once a change, and not for a file that says the same";
}

TEST(LocaleTest, CandidatesAreTheLocaleAndItsLanguage) {
  const std::vector<std::pair<std::string, Strings>> cases = {
      {"de_CH.UTF-8", {"de_CH", "de"}},
      {"ca_ES@valencia", {"ca_ES", "ca"}},
      {"en", {"en"}},
      {"C", {}},
      {"C.UTF-8", {}},
      {"POSIX", {}},
      {"", {}},
      {"../x_y", {}},
  };
  for (const auto& [lang, candidates] : cases) EXPECT_EQ(localizationCandidates(lang), candidates) << lang;
}

TEST_F(PlatformServicesTest, DirectoriesComeFromTheEnvironment) {
  for (const char* name : {"EXTORA_STATE_DIR", "EXTORA_APPLICATIONS", "EXTORA_MULTI_USER", "EXTORA_PLUGIN_USER",
                           "EXTORA_RUNTIME_DIR", "XDG_STATE_HOME"}) {
    ::unsetenv(name);
  }
  ::setenv("HOME", "/home/somebody", 1);
  ::setenv("XDG_RUNTIME_DIR", directory_.path("xdg").c_str(), 1);
  ::setenv("XDG_CONFIG_HOME", "relative/is/ignored", 1);
  const bool system = ::geteuid() == 0;
  Directories it = Directories::current();
  EXPECT_EQ(it.runtime, system ? "/run/extora" : directory_.path("xdg/extora"));
  EXPECT_EQ(it.state, system ? "/var/lib/extora" : "/home/somebody/.local/state/extora");
  EXPECT_EQ(it.config, system ? "/etc/extora" : "/home/somebody/.config/extora");
  EXPECT_EQ(it.plugInUser, system ? "extora-plugin" : "");
  EXPECT_EQ(it.multiUser, !system);
  EXPECT_EQ(it.systemApplications, (Strings{"/System/Applications", "/usr/share/extora/Applications"}));

  ::setenv("EXTORA_APPLICATIONS", ":/a/::b:", 1);
  ::setenv("EXTORA_MULTI_USER", system ? "1" : "0", 1);
  it = Directories::current();
  EXPECT_EQ(it.applications, (Strings{"/a", fs::current_path() / "b"}));
  EXPECT_EQ(it.multiUser, system);

  EXPECT_EQ(Directories::forClient("com.example").runtime, "/run/extora");
  fs::create_directories(directory_.path("xdg/extora/services"));
  ASSERT_EQ(::mknod(directory_.path("xdg/extora/services/com.example").c_str(), S_IFSOCK | 0666, 0), 0);
  EXPECT_EQ(Directories::forClient("com.example").runtime, directory_.path("xdg/extora"));
  ::setenv("EXTORA_RUNTIME_DIR", "/elsewhere", 1);
  EXPECT_EQ(Directories::forClient("com.example").runtime, "/elsewhere");

  EXPECT_TRUE(isPathSafeName("a" + std::string(127, '.')));
  for (const std::string& bad :
       {std::string(), std::string(129, 'a'), std::string(".a"), std::string("a/b"), std::string("\xC3\xBC")}) {
    EXPECT_FALSE(isPathSafeName(bad)) << bad;
  }
}

}  // namespace
}  // namespace platform
