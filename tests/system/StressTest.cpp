// Everything at once, for a bounded time: applications come, go and change places while hosts match, find, annotate,
// hold, and are killed. Then the daemon's answer is what lies in the folder, and nothing acknowledged is lost.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdio.h>

#include <atomic>
#include <map>
#include <random>
#include <set>
#include <thread>

#include "Extora/XTProtocol.h"
#include "platform/ipc/IpcCodec.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using tests::failureOf;

constexpr int kApplications = 12;

class StressTest : public ::testing::Test {
 protected:
  using Random = std::mt19937;
  // A number below `bound`.
  static int pick(Random& random, int bound) { return static_cast<int>(random() % static_cast<unsigned>(bound)); }
  // Calls `step` over and over in a thread of its own, until the time is over.
  void keepOn(const std::function<void(Random&)>& step) {
    threads_.emplace_back([this, step, seed = threads_.size()] {
      Random random(static_cast<unsigned>(seed));
      while (!over_) step(random);
    });
  }
  void runFor(std::chrono::seconds duration) {
    std::this_thread::sleep_for(duration);
    over_ = true;
    for (auto& thread : threads_) thread.join();
  }

  fs::path place(int number) const { return apps_ / ("app" + std::to_string(number) + ".app"); }
  // Plug-ins as the folder has them: identifier, version and path of each.
  void install(Random& random) {
    const int number = pick(random, kApplications);
    const auto name = "app" + std::to_string(number);
    const auto version = std::to_string(pick(random, 5));
    std::vector<tests::SampleBundle> plugIns;
    for (int i = 0; i <= pick(random, 3); ++i) {
      plugIns.push_back(
          tests::samplePlugIn("com." + name + ".p" + std::to_string(i), {{"HXExtensionVersion", version}}));
    }
    tests::installBundle(apps_, tests::sampleApplication("com.example." + name, std::move(plugIns)));
  }
  void changeFolder(Random& random) {
    const auto one = place(pick(random, kApplications));
    const auto other = place(pick(random, kApplications));
    switch (pick(random, 6)) {
      case 0:
        if (fs::exists(one)) tests::removeBundle(one);
        return;
      case 1:
        ::renameat2(AT_FDCWD, one.c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE);  // one may be missing
        return;
      case 2:
        ::renameat2(AT_FDCWD, one.c_str(), AT_FDCWD, other.c_str(), RENAME_NOREPLACE);
        return;
      default:
        install(random);
    }
  }
  std::set<std::string> inFolder() const {
    std::set<std::string> all;
    for (const auto& application : fs::directory_iterator(apps_)) {
      for (const auto& plugIn : fs::directory_iterator(application.path() / "PlugIns")) all.insert(plugIn.path());
    }
    return all;
  }
  // Paths of all that is offered. Each is there once, whatever the daemon is doing.
  std::set<std::string> offered(tests::Client& client, std::vector<Value>* forms = nullptr) const {
    std::set<std::string> paths;
    for (const Value& form : client.match({}, XTDiscoverAllVersions | XTDiscoverDuplicates)) {
      EXPECT_TRUE(paths.insert(form["path"].string()).second) << form["path"].string() << " twice";
      if (forms != nullptr) forms->push_back(form);
    }
    return paths;
  }

  std::shared_ptr<tests::Client> connect() const {
    return std::make_shared<tests::Client>(daemon_.runtime(), tests::Daemon::kService);
  }

  tests::Daemon daemon_;
  const fs::path apps_ = daemon_.applications();
  std::atomic<bool> over_ = false;
  std::vector<std::thread> threads_;
};

TEST_F(StressTest, TheDaemonEndsUpWithWhatLiesInTheFolder) {
  daemon_.setEnvironment("EXTORA_LOG", "error");
  const auto host = daemon_.writeHost("host");
  fs::rename(fs::path(host).parent_path(), daemon_.root() / "host.app");
  const auto program = daemon_.root() / "host.app" / fs::path(host).filename();
  daemon_.start();

  std::atomic<int> matches = 0;
  std::atomic<int> found = 0;
  std::atomic<int> holds = 0;
  std::atomic<int> deaths = 0;
  std::map<std::string, std::int64_t> noted;  // of one thread, then of this one

  keepOn([&](Random& random) { changeFolder(random); });
  for (int i = 0; i < 2; ++i) {
    keepOn([&, client = connect()](Random& random) {
      std::vector<Value> forms;
      offered(*client, &forms);
      ++matches;
      if (forms.empty()) return;
      const Value& form = forms[static_cast<std::size_t>(pick(random, static_cast<int>(forms.size())))];
      const Value reply = client->request("find", {{"uuids", *Uuid::parse(form["uuid"].string())}});
      const Value path = platform::fromWireMessage(reply["matches"])["path"];
      if (path == form["path"]) {
        ++found;
      } else {  // gone, or known but not to be described any more
        EXPECT_TRUE(failureOf(reply) == "15 Cannot locate PlugIn" || !reply["matches"]) << reply.describe();
      }
    });
  }
  keepOn([&, client = connect(), number = std::int64_t{0}](Random& random) mutable {
    const Array forms = client->match({});
    if (forms.size() == 0) return;
    const Value& form = forms[static_cast<std::size_t>(pick(random, static_cast<int>(forms.size())))];
    const auto failure = failureOf(
        client->request("annotate", {{"uuids", Array{*Uuid::parse(form["uuid"].string())}},
                                     {"annotations", Dictionary{{"extension", Dictionary{{"n", ++number}}}}}}));
    if (failure.empty()) noted[form["identifier"].string()] = number;
  });
  const auto hold = [&](tests::Client& client, Random& random) {
    const auto path = place(pick(random, kApplications)).string();
    const std::uint64_t flags = XTHoldFlagTerminate * static_cast<std::uint64_t>(pick(random, 2));
    const Value reply = client.request("lock", {{"paths", Array{path}}, {"flags", flags}});
    const bool granted = reply["uuids"].isUuid();
    EXPECT_TRUE(granted || failureOf(reply) == "9 invalid path: " + path) << reply.describe();
    if (granted) ++holds;
    return reply["uuids"];
  };
  keepOn([&, client = connect()](Random& random) {
    const Value token = hold(*client, random);
    const Array tokens = token ? Array{token} : Array{};
    EXPECT_EQ(failureOf(client->request("lock", {{"uuids", tokens}})), "");
  });
  keepOn([&](Random& random) {
    tests::Host client(daemon_, program);
    for (int i = 0; i <= pick(random, 4); ++i) hold(client, random);
    ::kill(client.pid(), SIGKILL);
    ++deaths;
  });
  const char* const seconds = std::getenv("EXTORA_TEST_STRESS_SECONDS");
  runFor(std::chrono::seconds(seconds == nullptr ? 3 : std::atoi(seconds)));

  const auto wanted = inFolder();
  auto client = daemon_.connect();
  std::set<std::string> last;
  EXPECT_TRUE(tests::eventually([&] { return (last = offered(client)) == wanted; }))
      << "offered: " << ::testing::PrintToString(last) << "\nin the folder: " << ::testing::PrintToString(wanted);
  for (const auto* count : {&matches, &found, &holds, &deaths}) EXPECT_GT(*count, 0);
  // What went away while it was being matched is told of; nothing else went wrong.
  EXPECT_EQ(tests::countOf(daemon_.log(), "\n"),
            daemon_.countInLog("ERROR ops: could not obtain fresh proxy for ") +
                daemon_.countInLog("ERROR ops: failed to export matching plug-in "));

  std::map<std::string, std::string> uuids;
  const auto look = [&] {
    std::vector<Value> forms;
    auto asking = daemon_.connect();
    EXPECT_EQ(offered(asking, &forms), wanted);
    for (const Value& form : forms) {
      const auto note = noted.find(form["identifier"].string());
      if (note != noted.end()) {
        EXPECT_EQ(form["annotations"]["extension"]["n"].integerValue(), note->second) << form["identifier"].string();
      }
      const auto& path = form["path"].string();
      const auto& uuid = uuids.emplace(path, form["uuid"].string()).first->second;
      EXPECT_EQ(uuid, form["uuid"].string()) << path << ", after a restart";
    }
  };
  look();
  EXPECT_EQ(daemon_.stop(), 0);
  daemon_.start();
  look();
}

}  // namespace
}  // namespace extora
