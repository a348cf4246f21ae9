// What does using a plug-in cost its host? A real xtd makes a sample plug-in ready, launches it in its sandbox, and it
// answers its first message; beside that, what bubblewrap takes alone to run /bin/true.
#include <fmt/format.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTHostServices.h"
#include "Extora/XTPlugInConnection.h"
#include "bench/Measure.h"
#include "platform/log/Log.h"
#include "tests/support/Daemon.h"

namespace {

using extora::XTDaemonClient;
using platform::Value;

[[noreturn]] void end(const std::string& why) {
  fmt::print(stderr, "bench_launch: {}\n", why);
  std::exit(1);
}

Value ask(const std::function<void(const XTDaemonClient::Reply&)>& send) {
  Value body;
  send([&](const platform::IpcReplyObject& reply) {
    if (const auto error = XTDaemonClient::errorInReply(reply)) end(error->localizedDescription());
    body = reply.body;
  });
  return body;
}

extora::XTHostServices::Launched launch(const std::string& executable) {
  extora::Error error;
  auto launched = extora::XTHostServices::launch(executable, &error);
  if (!launched) end(error.localizedDescription());
  return std::move(*launched);
}

void firstMessage(const std::string& executable) {
  static const platform::SerialQueue queue("bench");
  const auto connection = extora::XTPlugInConnection::initWithSocket(launch(executable).connection, queue);
  connection->resume();
  const auto answer = connection->call("apply", {"text"});
  if (answer.error) end(answer.error->localizedDescription());
}

void bubblewrap() {
  const pid_t child = ::fork();
  if (child == 0) {
    ::execlp("bwrap", "bwrap", "--unshare-all", "--ro-bind", "/", "/", "--dev", "/dev", "--proc", "/proc", "/bin/true",
             nullptr);
    ::_exit(127);
  }
  int status = 0;
  if (::waitpid(child, &status, 0) != child || status != 0) end("bubblewrap does not run");
}

void print(const char* what, const bench::Sample& sample) {
  fmt::print("{:<34}{:>12.2f}{:>12.2f}\n", what, sample.median / 1000, sample.p99 / 1000);
  std::fflush(stdout);
}

}  // namespace

int main() {
  platform::Log::configure("fault");
  tests::Daemon daemon;
  std::filesystem::permissions(daemon.root(), std::filesystem::perms(0755));
  daemon.setEnvironment("EXTORA_LOG", "default");
  daemon.setEnvironment("EXTORA_PROFILES", PROFILES);
  if (::geteuid() == 0) daemon.setEnvironment("EXTORA_PLUGIN_USER", "65534");
  auto plugIn = tests::samplePlugIn("com.example.x");
  plugIn.program = PLUG_IN;
  const auto application =
      tests::writeBundle(daemon.applications(), tests::sampleApplication("com.example.a", {plugIn}));
  const auto executable = application + "/PlugIns/x.appex/plugin";
  daemon.start();
  ::setenv("EXTORA_RUNTIME_DIR", daemon.runtime().c_str(), 1);

  const auto client = XTDaemonClient::initWithServiceName(std::nullopt);
  const Value found = ask([&](const auto& reply) { client->matchPlugIns({}, extora::XTDiscoverSynchronously, reply); });
  const Value form = client->convertFromIPC(found["matches"]).at(0);
  const auto uuid = platform::Uuid::parse(form["uuid"].string());
  if (!uuid) end("the plug-in is not offered");
  const XTDaemonClient::PlugIns plugIns{std::pair(form["path"].string(), *uuid)};

  fmt::print("{:<34}{:>12}{:>12}\n", "one plug-in", "median ms", "p99 ms");
  print("ready", bench::measure([&] {
          (void)ask([&](const auto& reply) { client->readyPlugIns(plugIns, true, 0, {}, reply); });
        }));
  print("launch until it runs", bench::measure([&] { (void)launch(executable); }));
  print("launch until its first answer", bench::measure([&] { firstMessage(executable); }));
  print("bubblewrap alone, /bin/true", bench::measure(bubblewrap));
  return 0;
}
