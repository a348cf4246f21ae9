// TestPlatform: a platform for tests of the daemon's objects: real files below a directory of its own, a FakeRegistry,
// and services that remember what they were asked. For one thread at a time.
#pragma once

#include <cstdlib>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <variant>
#include <vector>

#include "platform/Platform.h"
#include "tests/support/FakeRegistry.h"

namespace tests {

/// A directory that exists as long as the object.
class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    std::string name = (std::filesystem::temp_directory_path() / "extora-XXXXXX").native();
    if (mkdtemp(name.data()) == nullptr) std::abort();
    path_ = name;
  }
  ~TemporaryDirectory() { std::filesystem::remove_all(path_); }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;
  std::string path(const std::string& name = "") const { return name.empty() ? path_ : path_ + "/" + name; }

 private:
  std::string path_;
};

class FakeLocale : public platform::Locale {
 public:
  std::string current() override { return "C"; }
  std::unique_ptr<Observation> observe(std::function<void()> handler) override {
    handlers.push_back(std::move(handler));
    return std::make_unique<Observation>();
  }
  void startWatching() override {}
  void change() {
    for (const auto& handler : handlers) handler();
  }
  std::vector<std::function<void()>> handlers;
};

class FakeContainers : public platform::Containers {
 public:
  std::variant<std::string, std::uint64_t> containerCreateOrLookup(unsigned, const std::string&, unsigned) override {
    ++asked;
    return answer;
  }
  bool isMultiUserMode() override { return multiUser; }
  std::variant<std::string, std::uint64_t> answer;
  bool multiUser = false;
  int asked = 0;
};

class FakeNotifications : public platform::Notifications {
 public:
  void prepare(const std::string&) override {}
  void postNotification(const std::string& name) override { posted.push_back(name); }
  std::optional<std::uint64_t> counter(const std::string&) override { return posted.size(); }
  std::vector<std::string> posted;
};

struct TestPlatform {
  TestPlatform() {
    containers->answer = directory.path("container");
    std::filesystem::create_directory(directory.path("container"));
    services->directories.globalAnnotations = directory.path("global");
    services->files = platform::Files::make();
    services->containers = containers;
    services->locale = locale;
    services->notifications = notifications;
    services->registry = registry;
  }

  TemporaryDirectory directory;
  std::shared_ptr<FakeRegistry> registry = std::make_shared<FakeRegistry>();
  std::shared_ptr<FakeContainers> containers = std::make_shared<FakeContainers>();
  std::shared_ptr<FakeLocale> locale = std::make_shared<FakeLocale>();
  std::shared_ptr<FakeNotifications> notifications = std::make_shared<FakeNotifications>();
  std::shared_ptr<platform::Platform> services = std::make_shared<platform::Platform>();
};

}  // namespace tests
