// What do a start, an install and the memory of what is installed cost? A real xtd in private directories with 1,000
// and 10,000 plug-ins: how soon after its start it has answered (without and with its memory of the last run), how soon
// after the renaming an application is offered, and what of the processor's time that takes.
#include <fmt/format.h>
#include <time.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <thread>
#include <vector>

#include "platform/log/Log.h"
#include "tests/support/Daemon.h"
#include "tests/support/SampleBundles.h"

namespace {

namespace fs = std::filesystem;
using platform::Value;
using tests::Daemon;
using Clock = std::chrono::steady_clock;

constexpr std::size_t kInstalls = 100;
constexpr const char* kChange = "com.orvane.registry-change";

double millisecondsSince(Clock::time_point start) {
  return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

[[noreturn]] void fail(const std::string& text) {
  fmt::print(stderr, "bench_life: {}\n", text);
  std::exit(1);
}

double cpuMilliseconds(pid_t pid) {
  clockid_t clock{};
  timespec time{};
  if (::clock_getcpuclockid(pid, &clock) != 0 || ::clock_gettime(clock, &time) != 0) fail("no processor time");
  return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_nsec) / 1e6;
}

// In MiB; `key` as /proc/<pid>/status has it.
double memory(pid_t pid, const std::string& key) {
  std::ifstream status(fmt::format("/proc/{}/status", pid));
  for (std::string word; status >> word;) {
    double kilobytes = 0;
    if (word == key + ":" && status >> kilobytes) return kilobytes / 1024;
  }
  fail("no " + key);
}

bool offers(tests::Client& client, const std::string& identifier) {
  return client.match({{"HXExtensionIdentifier", identifier}}).size() == 1;
}

// Starts the daemon and asks its first two questions.
void start(Daemon& daemon, const char* how, std::size_t plugIns) {
  const auto begun = Clock::now();
  daemon.start();
  auto client = daemon.connect();
  const auto forms = client.match({{"HXExtensionIdentifier", "com.example.app7.plugin3"}});
  const double match = millisecondsSince(begun);
  if (forms.size() != 1) fail("a plug-in is not offered after the start");
  const Value uuid = *platform::Uuid::parse(forms[0]["uuid"].string());
  if (client.request("find", {{"uuids", uuid}})["matches"].isNothing()) fail("a plug-in is not found after the start");
  const double find = millisecondsSince(begun);
  const pid_t pid = daemon.process().pid();
  fmt::print("{:<26}{:>10}{:>12.1f}{:>12.1f}{:>12.1f}{:>12.1f}{:>12.1f}\n", how, plugIns, match, find,
             cpuMilliseconds(pid), memory(pid, "VmRSS"), memory(pid, "VmHWM"));
  std::fflush(stdout);
}

// Installs and removes applications one after another; `seen` answers whether the one of an identifier has arrived.
void install(Daemon& daemon, const char* what, std::size_t plugIns, const std::function<bool(std::size_t)>& seen) {
  const fs::path place = daemon.applications() / ".waiting";
  fs::create_directory(place);
  std::vector<fs::path> written;
  for (std::size_t i = 0; i < kInstalls; ++i) {
    const std::string identifier = fmt::format("com.example.new{}", i);
    const auto application = tests::sampleApplication(identifier, {tests::samplePlugIn(identifier + ".plugin")});
    written.emplace_back(tests::writeBundle(place, application));
  }
  const pid_t pid = daemon.process().pid();
  std::vector<double> times;
  double cpu = 0;
  for (std::size_t i = 0; i < kInstalls; ++i) {
    const double before = cpuMilliseconds(pid);
    const auto begun = Clock::now();
    fs::rename(written[i], daemon.applications() / written[i].filename());
    while (!seen(i)) {
      if (millisecondsSince(begun) > 10'000) fail("an application is not noticed");
    }
    times.push_back(millisecondsSince(begun));
    cpu += cpuMilliseconds(pid) - before;
  }
  std::sort(times.begin(), times.end());
  fmt::print("{:<26}{:>10}{:>12.2f}{:>12.2f}{:>12.2f}\n", what, plugIns, times[kInstalls / 2],
             times[kInstalls * 99 / 100], cpu / kInstalls);
  std::fflush(stdout);
  const auto changes = daemon.notificationCount(kChange);
  for (const fs::path& each : written) fs::rename(daemon.applications() / each.filename(), each);
  fs::remove_all(place);
  while (daemon.notificationCount(kChange) == changes) std::this_thread::yield();
}

void measureWith(std::size_t plugIns) {
  Daemon daemon;
  daemon.setEnvironment("EXTORA_LOG", "error");
  for (const auto& application : tests::sampleApplications(plugIns / 10, 10)) {
    tests::writeBundle(daemon.applications(), application);
  }
  fmt::print("{:<26}{:>10}{:>12}{:>12}{:>12}{:>12}{:>12}\n", "start", "plug-ins", "match ms", "find ms", "cpu ms",
             "RSS MiB", "peak MiB");
  start(daemon, "cold", plugIns);
  for (const char* how : {"warm", "warm again"}) {
    if (daemon.stop() != 0) fail("the daemon has not stopped well");
    start(daemon, how, plugIns);
  }
  auto client = daemon.connect();
  fmt::print("{:<26}{:>10}{:>12}{:>12}{:>12}\n", "install", "plug-ins", "median ms", "p99 ms", "cpu ms");
  install(daemon, "until offered", plugIns,
          [&](std::size_t i) { return offers(client, fmt::format("com.example.new{}.plugin", i)); });
  std::uint64_t changes = daemon.notificationCount(kChange);
  install(daemon, "until announced", plugIns,
          [&](std::size_t) { return daemon.notificationCount(kChange) > changes && ++changes != 0; });
  const auto begun = Clock::now();
  if (client.match({}, 0).size() != plugIns) fail("not everything is offered");
  fmt::print("{:<26}{:>10}{:>12.1f} ms, then {:.1f} MiB\n", "match of all, first", plugIns, millisecondsSince(begun),
             memory(daemon.process().pid(), "VmRSS"));
}

}  // namespace

int main() {
  platform::Log::configure("fault");
  for (const std::size_t plugIns : {1'000, 10'000}) measureWith(plugIns);
  return 0;
}
