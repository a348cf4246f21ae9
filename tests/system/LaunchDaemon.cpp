// launch_daemon: a daemon for tests that has the platform's services and nothing of xtd: the host services, and a
// service "com.example.launches" through which a test says what xtd would say to the job manager and the sandbox.
//
//   {"ask": "ready", "executable", "overlay", ["pid"]}  registers it for that process, or for who asks  -> "result"
//   {"ask": "remove", "identifier", "version"}          answers when the job manager has                 -> "result"
//   {"ask": "instances", "identifier"}                  -> "pids", "busy" (what busy queries answer)
//   {"ask": "issue", "path", "boundary"}                -> "token"
//   {"ask": "issue-service", "class", "name"}           -> "token"
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdio>

#include "platform/Platform.h"
#include "platform/hostservices/HostServices.h"
#include "platform/queue/MainRunLoop.h"

using namespace platform;

namespace {

class Launches {
 public:
  explicit Launches(std::shared_ptr<Platform> platform) : platform_(std::move(platform)) {}

  bool serve() {
    listener_ = ipcCreateListener(platform_->directories.runtime, "com.example.launches", queue_, nullptr);
    if (listener_ == nullptr) return false;
    listener_->setEventHandler([this](const IpcEvent& event) {
      const auto* connection = std::get_if<std::shared_ptr<IpcConnection>>(&event);
      if (connection == nullptr) return;
      (*connection)->setEventHandler([this, weak = std::weak_ptr(*connection)](const IpcEvent& arrived) {
        const auto* message = std::get_if<IpcMessage>(&arrived);
        const auto asking = weak.lock();
        if (message != nullptr && asking != nullptr) handle(asking, *message);
      });
      (*connection)->resume();
    });
    listener_->resume();
    return true;
  }

 private:
  void handle(const std::shared_ptr<IpcConnection>& connection, const IpcMessage& message) {
    const Value& body = message.body;
    IpcReply reply = ipcCreateReply(message);
    const std::string& ask = body["ask"].string();
    int number = 0;
    if (ask == "remove") {
      platform_->jobs->jobRemoveExternalService(body["identifier"].string(), body["version"].string(), answers_,
                                                [connection, reply](int result) mutable {
                                                  reply.body.set("result", result);
                                                  connection->send(reply);
                                                });
      return;
    }
    if (ask == "ready") {
      const UniqueFd pidfd(static_cast<int>(::syscall(SYS_pidfd_open, body["pid"].integerValue(), 0)));
      const auto host = body["pid"] ? PeerIdentity::ofPidfd(pidfd.get()) : connection->peer();
      number = platform_->jobs->jobAddExternalService(host, body["executable"].string(), body["overlay"]);
      reply.body.set("result", number);
    } else if (ask == "instances") {
      Array pids;
      for (const auto& instance : platform_->jobs->instances(body["identifier"].string())) pids.append(instance.pid);
      reply.body.set("pids", pids);
      reply.body.set("busy", platform_->assertions->queryBusyInstances({body["identifier"].string()}));
    } else if (ask == "issue") {
      reply.body.set(
          "token", platform_->sandbox->issueFileReadExtension(body["path"].string(), body["boundary"].string(), &number)
                       .value_or(""));
    } else if (ask == "issue-service") {
      reply.body.set("token",
                     platform_->sandbox->issueServiceExtension(body["class"].string(), body["name"].string(), &number)
                         .value_or(""));
    }
    connection->send(reply);
  }

  const std::shared_ptr<Platform> platform_;
  SerialQueue queue_{"launches"};
  const std::shared_ptr<SerialQueue> answers_ = std::make_shared<SerialQueue>("answers");
  std::shared_ptr<IpcListener> listener_;
};

}  // namespace

int main() {
  MainRunLoop::blockSignals();
  Error error;
  const auto platform = Platform::make(Directories::current(), &error);
  if (platform == nullptr) {
    std::fprintf(stderr, "launch_daemon: %s\n", error.describe().c_str());
    return 1;
  }
  const auto services = HostServices::make({platform->directories, platform->jobs, platform->sandbox});
  if (services != nullptr) services->resume();
  Launches launches(platform);
  if (!launches.serve()) return 1;
  const auto stop = MainRunLoop::main().addSignal(SIGTERM, [] { MainRunLoop::exitProcess(0); });
  std::fputs("launch_daemon: serving\n", stderr);
  MainRunLoop::main().run();
  return 0;
}
