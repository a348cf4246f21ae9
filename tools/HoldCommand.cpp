#include "tools/HoldCommand.h"

#include <fmt/format.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>

#include "platform/assertions/ProcessAssertions.h"
#include "platform/files/UniqueFd.h"
#include "tools/Json.h"
#include "tools/PlugInReference.h"
#include "tools/Table.h"

extern char** environ;

namespace tools {

using platform::UniqueFd;
using platform::Uuid;
using platform::Value;

namespace {

constexpr int kSignals[] = {SIGINT, SIGTERM, SIGHUP};
constexpr int kLookMs = 250;  // how often the connection is looked at

std::atomic<int> arrived = 0;  // the last signal

void noteSignals() {
  struct sigaction action {};
  action.sa_handler = [](int number) { arrived = number; };
  for (const int number : kSignals) ::sigaction(number, &action, nullptr);
}

// Says so, once, when the hold has ended with its connection.
bool isLost(const DaemonSession& daemon, bool& said) {
  if (!daemon.isConnected() && !std::exchange(said, true)) complain("the daemon has gone, and the hold with it");
  return said;
}

// Runs the command to its end. A signal of the terminal reaches it by itself; any other is passed on.
int runCommand(const std::vector<std::string>& words, const DaemonSession& daemon) {
  std::vector<char*> arguments;
  for (const auto& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  sigset_t defaults;
  ::sigemptyset(&defaults);
  for (const int number : kSignals) ::sigaddset(&defaults, number);
  posix_spawnattr_setsigdefault(&attributes, &defaults);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF);
  pid_t pid = -1;
  const int error = ::posix_spawnp(&pid, words[0].c_str(), nullptr, &attributes, arguments.data(), environ);
  posix_spawnattr_destroy(&attributes);
  if (error != 0) {
    complain(fmt::format("{}: {}", words[0], std::strerror(error)));
    return error == ENOENT ? 127 : 126;
  }
  const UniqueFd pidfd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  pollfd ended{pidfd.get(), POLLIN, 0};
  for (bool lost = false; ::poll(&ended, 1, kLookMs) != 1;) {
    (void)isLost(daemon, lost);
    if (const int number = arrived.exchange(0); number != 0 && number != SIGINT) ::kill(pid, number);
  }
  int status = 0;
  ::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

CLI::App* HoldCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("hold", "Keep plug-ins from being used, while a command runs");
  command->add_option("path", paths_, "Applications, all of whose plug-ins are held")
      ->required()
      ->option_text("PATH... [-- COMMAND [ARGUMENT...]]");
  command->add_flag("--plug-ins", plugIns_, "The paths are of plug-ins");
  command->add_flag("--refuse-busy", refuseBusy_, "Hold nothing when one of them is busy");
  command->add_flag("--terminate", terminate_, "End their running instances, and wait until they have ended");
  command->add_flag("--json", json_, "The token, or what is busy, as JSON");
  command->footer(R"(What is held is offered to nobody and cannot be made ready. The hold ends with COMMAND, whose
exit status becomes this one; without COMMAND when this is interrupted, or by
`xtctl release TOKEN`; and always with this process.

Examples
  xtctl hold /apps/Mail.app --terminate -- rsync -a new/Mail.app/ /apps/Mail.app
  xtctl hold Mail.app/PlugIns/Filter.appex --plug-ins --refuse-busy)");
  return command;
}

ExitStatus HoldCommand::ask(DaemonSession& daemon, Value& reply) const {
  std::uint64_t flags = 0;
  if (plugIns_) flags |= extora::XTHoldFlagPlugInPaths;
  if (refuseBusy_) flags |= extora::XTHoldFlagRefuseBusy;
  if (terminate_) flags |= extora::XTHoldFlagTerminate;
  // What is busy stands beside the error, in a reply that ask() would not hand on.
  return daemon.ask(
      [&](auto& client, const auto& answer) {
        client.holdPlugins(absolutePaths(paths_), flags, [&reply, answer](const platform::IpcReplyObject& object) {
          if (!object.error) reply = object.body;
          answer(object);
        });
      },
      reply);
}

ExitStatus HoldCommand::run(DaemonSession& daemon, std::string& out) {
  Value reply;
  ExitStatus status = ask(daemon, reply);
  if (const Value conflicts = reply[extora::XTDConflictsKey]; conflicts.isArray()) {
    Table table({"BUSY"});
    for (const Value& each : conflicts.items()) table.addRow({each[platform::kBusyBundleIdentifierKey].string()});
    out += json_ ? jsonText(conflicts) : table.text();
  }
  if (status != ExitStatus::Success) return status;
  const Uuid token = reply[extora::XTDUUIDKey].uuid();
  noteSignals();
  const std::string said = json_ ? jsonLine(platform::Dictionary{{"token", token}}) : "hold " + token.text() + "\n";
  // Standard output is the command's.
  std::fputs(said.c_str(), command_.empty() ? stdout : stderr);
  std::fflush(stdout);

  bool lost = false;
  if (!command_.empty()) {
    status = static_cast<ExitStatus>(runCommand(command_, daemon));
    if (!daemon.isConnected()) return status;
  } else {
    while (arrived == 0 && !isLost(daemon, lost)) ::poll(nullptr, 0, kLookMs);
    if (lost) return ExitStatus::Unreachable;
  }
  Value released;
  (void)daemon.ask([&](auto& client, const auto& answer) { client.releaseHold(token, answer); }, released);
  return status;
}

}  // namespace tools
