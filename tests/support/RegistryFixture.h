// RegistryFixture: a bundle registry over real folders below a directory of its own, which can be stopped and started
// again; and what it tells its observers. Main thread.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/queue/MainRunLoop.h"
#include "platform/queue/Mutex.h"
#include "platform/registry/BundleRegistry.h"
#include "tests/support/LogCapture.h"
#include "tests/support/SampleBundles.h"
#include "tests/support/TestPlatform.h"

namespace tests {

/// A locale with one observer at a time.
class SettableLocale : public platform::Locale {
 public:
  std::string current() override { return lang; }
  std::unique_ptr<Observation> observe(std::function<void()> handler) override {
    class Ending : public Observation {
     public:
      explicit Ending(std::function<void()>& observer) : observer_(observer) {}
      ~Ending() override { observer_ = nullptr; }
      Ending(const Ending&) = delete;
      Ending& operator=(const Ending&) = delete;

     private:
      std::function<void()>& observer_;
    };
    observer_ = std::move(handler);
    return std::make_unique<Ending>(observer_);
  }
  void startWatching() override {}
  void changeTo(const std::string& other) {
    lang = other;
    observer_();
  }
  std::string lang = "C";

 private:
  std::function<void()> observer_;
};

/// Writes down what it is told, one text a call: "-a b" or "+a b" with the identifiers, sorted.
class RecordingObserver : public platform::RegistryObserver {
 public:
  void pluginsDidInstall(const platform::PlugInRecords& records) override { add("+", records); }
  void pluginsWillUninstall(const platform::PlugInRecords& records) override { add("-", records); }
  std::vector<std::string> take() {
    const platform::MutexLock lock(mutex_);
    return std::exchange(calls_, {});
  }

 private:
  void add(std::string text, const platform::PlugInRecords& records) {
    std::vector<std::string> identifiers;
    for (const auto& record : records) identifiers.push_back(record->plugInIdentifier);
    std::sort(identifiers.begin(), identifiers.end());
    for (const std::string& each : identifiers) text += text.size() == 1 ? each : " " + each;
    const platform::MutexLock lock(mutex_);
    calls_.push_back(std::move(text));
  }
  platform::Mutex mutex_;
  std::vector<std::string> calls_ XT_GUARDED_BY(mutex_);
};

class RegistryFixture : public ::testing::Test {
 protected:
  using Names = std::vector<std::string>;

  RegistryFixture() {
    for (const char* each : {"apps", "system", "plugins", "points"}) {
      std::filesystem::create_directory(directory_.path(each));
    }
    platform::Directories& directories = options_.directories;
    directories.state = directory_.path("state");
    directories.runtime = directory_.path("runtime");
    directories.applications = {apps_};
    directories.systemApplications = {directory_.path("system")};
    directories.systemPlugIns = directory_.path("plugins");
    directories.extensionPoints = directory_.path("points");
    std::filesystem::create_directories(directories.runtime + "/notify");
    options_.files = platform::Files::make();
    options_.containers = platform::Containers::make(directories, options_.files);
    options_.locale = locale_;
    options_.notifications = platform::Notifications::make(directories);
    options_.watch = false;
  }

  void start() {
    registry_.reset();
    registry_ = std::make_shared<platform::BundleRegistry>(options_);
    observer_ = std::make_shared<RecordingObserver>();
    registry_->registryAddObserver(observer_);
  }

  /// The identifiers of all plug-ins, sorted.
  Names names() const {
    Names all;
    for (const auto& record : registry_->registryInstalledPlugIns()) all.push_back(record->plugInIdentifier);
    std::sort(all.begin(), all.end());
    return all;
  }
  platform::PlugInRecord named(const std::string& identifier) const {
    for (auto& record : registry_->registryInstalledPlugIns()) {
      if (record->plugInIdentifier == identifier) return record;
    }
    return nullptr;
  }
  /// Runs the main loop until `condition` holds; false after twenty seconds.
  static bool waitFor(const std::function<bool()>& condition) {
    using Clock = std::chrono::steady_clock;
    platform::MainRunLoop& loop = platform::MainRunLoop::main();
    const auto deadline = Clock::now() + std::chrono::seconds(20);
    bool over = false;  // one stop a wait: a second one would end the next wait's run
    const auto timer = loop.addTimer(2, [&] {
      if (over || !(condition() || Clock::now() > deadline)) return;
      over = true;
      loop.stop();
    });
    while (!over) loop.run();
    return condition();
  }

  TemporaryDirectory directory_;
  const std::string apps_ = directory_.path("apps");
  std::shared_ptr<SettableLocale> locale_ = std::make_shared<SettableLocale>();
  platform::BundleRegistryOptions options_;
  LogCapture log_;
  std::shared_ptr<RecordingObserver> observer_;
  std::shared_ptr<platform::BundleRegistry> registry_;
};

}  // namespace tests
