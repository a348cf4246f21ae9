// probe_plugin: a plug-in that says what it can see and do. Started in a sandbox it answers its host's requests, each a
// map with "ask"; on SIGTERM it writes the file "terminated" into its home and ends with status 0.
//
//   report                   environment, descriptors, processes, status and libraries (files of /proc), interfaces,
//   ids open PATH FLAGS          -> "errno" of opening it connect PATH, tcp PORT   -> "errno" of connecting
//   user-namespace           -> "errno" of making one
//   begin, end               activity -> "errno"
//   ignore-term              from here on SIGTERM has no effect
//
// Outside of a sandbox, `probe_plugin launch EXECUTABLE` asks the host services for that and exits with the error
// number; `probe_plugin host EXECUTABLE` has the daemon make the plug-in ready first.
#include <arpa/inet.h>
#include <fcntl.h>
#include <net/if.h>
#include <sched.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>
#include <string_view>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTHostServices.h"
#include "platform/ipc/IpcConnection.h"

extern char** environ;

namespace {

using platform::Array;
using platform::Dictionary;
using platform::UniqueFd;
using platform::Value;

int errnoOf(long result) {
  return result < 0 ? errno : 0;
}

std::string textOf(const std::string& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

Array namesIn(const std::string& directory) {
  Array names;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    names.append(entry.path().filename().native());
  }
  return names;
}

// As they were before anything was opened here.
Array descriptors;

void listDescriptors() {
  for (int fd = 0; fd < 1024; ++fd) {
    if (::fcntl(fd, F_GETFD) < 0) continue;
    std::error_code error;
    const auto target = std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd), error);
    descriptors.append(std::to_string(fd) + " " + target.native());
  }
}

Dictionary report() {
  Array environment;
  for (char** entry = environ; *entry != nullptr; ++entry) environment.append(*entry);
  Array processes;
  const Array all = namesIn("/proc");
  for (const Value& name : all) {
    if (name.string().find_first_not_of("0123456789") == std::string::npos) processes.append(name);
  }
  Array interfaces;
  struct if_nameindex* const list = ::if_nameindex();
  for (auto* each = list; each != nullptr && each->if_index != 0; ++each) interfaces.append(each->if_name);
  ::if_freenameindex(list);
  return {{"environment", environment},
          {"descriptors", descriptors},
          {"processes", processes},
          {"interfaces", interfaces},
          {"status", textOf("/proc/self/status")},
          {"libraries", textOf("/proc/self/maps")},
          {"first", textOf("/proc/1/environ")},
          {"uid", static_cast<std::int64_t>(::getuid())},
          {"session", static_cast<std::int64_t>(::getsid(0))}};
}

int connectTo(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  const UniqueFd fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return errnoOf(::connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address));
}

int connectToPort(std::uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const UniqueFd fd(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  return errnoOf(::connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address));
}

int codeOf(const std::optional<extora::Error>& error) {
  return error ? static_cast<int>(error->code) : 0;
}

Dictionary serve(const Value& request) {
  const std::string& ask = request["ask"].string();
  if (ask == "report") return report();
  int number = EINVAL;
  if (ask == "open") {
    const UniqueFd fd(
        ::open(request["path"].string().c_str(), static_cast<int>(request["flags"].integerValue()) | O_CLOEXEC, 0600));
    number = fd ? 0 : errno;
  } else if (ask == "connect") {
    number = connectTo(request["path"].string());
  } else if (ask == "tcp") {
    number = connectToPort(static_cast<std::uint16_t>(request["port"].integerValue()));
  } else if (ask == "user-namespace") {
    number = errnoOf(::unshare(CLONE_NEWUSER));
  } else if (ask == "begin") {
    number = codeOf(extora::XTHostServices::beginActivity());
  } else if (ask == "end") {
    number = codeOf(extora::XTHostServices::endActivity());
  } else if (ask == "ignore-term") {
    ::signal(SIGTERM, SIG_IGN);
    number = 0;
  }
  return {{"errno", number}};
}

// False when the daemon does not make the plug-in of that executable ready for this process.
bool makeReady(const std::filesystem::path& executable) {
  const auto client = extora::XTDaemonClient::initWithServiceName(std::nullopt);
  const auto answerTo = [](const auto& send) {
    std::promise<Value> answer;
    send([&](const platform::IpcReplyObject& reply) { answer.set_value(reply.body); });
    return answer.get_future().get();
  };
  const auto bundle = platform::Url::file(executable.parent_path().native());
  const Value found = answerTo([&](const auto& reply) { client->findPlugInByPathURL(bundle, reply); });
  const auto uuid = platform::Uuid::parse(client->convertFromIPC(found["matches"])["uuid"].string());
  if (!uuid) return false;
  return answerTo([&](const auto& reply) {
           client->readyPlugIns({std::pair(bundle.path(), *uuid)}, false, 0, {}, reply);
         })["error"]
      .isNothing();
}

int launch(const char* executable) {
  extora::Error error;
  const auto launched = extora::XTHostServices::launch(executable, &error);
  if (!launched) return static_cast<int>(error.code);
  std::printf("%d\n", static_cast<int>(launched->pid));
  return 0;
}

// Where SIGTERM leaves its trace; made before the handler is set.
std::string terminatedPath;

void terminated(int) {
  ::close(::open(terminatedPath.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  ::_exit(0);
}

}  // namespace

int main(int argc, char* argv[]) {
  if (argc == 3) {
    if (argv[1] == std::string_view("host") && !makeReady(argv[2])) return 1;
    return launch(argv[2]);
  }
  listDescriptors();
  if (const char* home = std::getenv("HOME")) terminatedPath = std::string(home) + "/terminated";
  ::signal(SIGTERM, terminated);

  static const platform::SerialQueue queue("probe");
  std::promise<void> hostHasGone;
  const auto connection = platform::ipcConnectionOverSocket(UniqueFd(3), queue);
  connection->setEventHandler([&](const platform::IpcEvent& event) {
    if (const auto* request = std::get_if<platform::IpcMessage>(&event)) {
      platform::IpcReply reply = platform::ipcCreateReply(*request);
      reply.body = serve(request->body);
      connection->send(reply);
    } else if (const auto* error = std::get_if<platform::IpcError>(&event)) {
      if (error->kind == platform::IpcError::Kind::ConnectionInvalid) hostHasGone.set_value();
    }
  });
  connection->resume();
  hostHasGone.get_future().wait();
  return 0;
}
