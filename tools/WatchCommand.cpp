#include "tools/WatchCommand.h"

#include <fmt/format.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <chrono>

#include "Extora/XTNotificationWatcher.h"
#include "Extora/XTVocabulary.h"
#include "platform/value/DateText.h"
#include "tools/Json.h"
#include "tools/OfferedPlugIns.h"
#include "tools/PlugInText.h"
#include "tools/RuleArguments.h"

namespace tools {

using extora::XTDaemonClient;
using extora::XTNotificationWatcher;
using platform::Value;

namespace {

// Nobody announces that exclusions change, or that the daemon has crashed: it is asked now and then without a reason,
// and the connection is looked at more often.
constexpr int kUnaskedMs = 5000;
constexpr int kLookMs = 250;

// What has been printed is complete at any time, so the end may come at any time.
void endWhenInterrupted() {
  struct sigaction action {};
  action.sa_handler = [](int) { ::_exit(static_cast<int>(ExitStatus::Success)); };
  for (const int signal : {SIGINT, SIGTERM, SIGHUP}) ::sigaction(signal, &action, nullptr);
}

std::int64_t secondsNow() {
  return std::chrono::duration_cast<std::chrono::seconds>(std::chrono::system_clock::now().time_since_epoch()).count();
}

bool write(const std::string& text) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) == text.size() && std::fflush(stdout) == 0) return true;
  complain("the changes cannot be written any more");
  return false;
}

}  // namespace

CLI::App* WatchCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("watch", "Print each change of what this program is offered, as it happens");
  addRuleOptions(*command, rules_, rulesFile_);
  command->add_flag("--all-versions", allVersions_, "Every version of a plug-in, and equal ones, not only the newest");
  command->add_flag("--json", json_, "One JSON object a line");
  command->footer(R"(A line has the time, what has happened, and the plug-in's identifier, version, UUID and path:
  installed  it is new on the device       offered    it was there, but not offered
  removed    it is not there any more      withdrawn  it is held, excluded, replaced by a newer one...
  changed    its form says something else: an election, a note, a name
Ends with status 0 when it is interrupted. A daemon that goes away is waited for.

Examples
  xtctl watch
  xtctl watch --rule HXExtensionPointName=com.example.photo-editing --json)");
  return command;
}

ExitStatus WatchCommand::run(DaemonSession& daemon, std::string&) {
  std::string fault;
  const auto rules = rulesOf(rules_, rulesFile_, fault);
  if (!rules) {
    complain(fault);
    return ExitStatus::Usage;
  }
  std::uint64_t flags = extora::XTDiscoverSynchronously;
  if (allVersions_) flags |= extora::XTDiscoverAllVersions | extora::XTDiscoverDuplicates;

  const auto annotations = XTNotificationWatcher::initWithName(extora::XTNotifyAnnotationChange, daemon.service());
  const auto installs = XTNotificationWatcher::initWithName(platform::kRegistryChangeNotification, daemon.service());
  if (!annotations || !installs) {
    complain("the system has no more watches to give");
    return ExitStatus::Refused;
  }
  const auto exists = [&](const std::string& uuid) {
    const auto reply = daemon.request([&](auto& client, const auto& answer) {
      client.findPlugInByUUID(platform::Uuid::parse(uuid).value_or(platform::Uuid()), answer);
    });
    const auto error = XTDaemonClient::errorInReply(reply);
    return !error || error->code != extora::XTErrorNotFound;
  };

  OfferedPlugIns offered(secondsNow());
  bool first = true;
  bool away = false;
  for (;;) {
    const auto ask = [&](auto& client, const auto& answer) { client.matchPlugIns(*rules, flags, answer); };
    Value reply;
    if (first) {
      if (const ExitStatus status = daemon.ask(ask, reply); status != ExitStatus::Success) return status;
      endWhenInterrupted();
    } else if (const auto object = daemon.request(ask); object.error) {
      if (!away) complain("the daemon has gone; waiting for it");
      away = true;
      daemon.reconnect();
    } else if (const auto error = XTDaemonClient::errorInReply(object)) {
      complain(fmt::format("the daemon refused: {} (code {})", error->localizedDescription(), error->code));
      return ExitStatus::Refused;
    } else {
      if (std::exchange(away, false)) complain("the daemon is back");
      reply = object.body;
    }
    if (!away) {
      const auto changes = offered.update(sortedForms(daemon.matches(reply)), exists);
      if (std::exchange(first, false)) complain(fmt::format("{} plug-ins are offered; watching", offered.size()));
      const std::string now = platform::dateText({secondsNow(), 0}).value_or("");
      for (const auto& change : changes) {
        auto record = changeRecord(change);
        record.set("time", now);
        if (!write(json_ ? jsonLine(record) : now + "  " + changeLine(change) + "\n")) return ExitStatus::Refused;
      }
    }
    struct pollfd entries[] = {{annotations->descriptor(), POLLIN, 0}, {installs->descriptor(), POLLIN, 0}};
    for (int waited = 0; waited < kUnaskedMs && ::poll(entries, std::size(entries), kLookMs) <= 0; waited += kLookMs) {
      if (!daemon.isConnected()) break;
    }
    (void)annotations->take();
    (void)installs->take();
  }
}

}  // namespace tools
