#include "tests/support/Daemon.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <fstream>
#include <iostream>
#include <utility>

#include "platform/ipc/IpcCodec.h"

namespace tests {
namespace {

sockaddr_un addressOf(const std::filesystem::path& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  return address;
}

const sockaddr* generic(const sockaddr_un& address) {
  return reinterpret_cast<const sockaddr*>(&address);
}

}  // namespace

SocketPair socketPair() {
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) std::abort();
  return {platform::UniqueFd(ends[0]), platform::UniqueFd(ends[1])};
}

std::string failureOf(const Value& reply) {
  if (!reply["errorcode"]) return {};
  return std::to_string(reply["errorcode"].exactUnsigned()) + " " + reply["error"].string();
}

platform::Bytes frame(platform::IpcFrameHeader header, const platform::Bytes& body) {
  header.bodyLength = static_cast<std::uint32_t>(body.size());
  const auto head = header.serialize();
  platform::Bytes bytes(head.size() + body.size());
  std::copy(body.begin(), body.end(), std::copy(head.begin(), head.end(), bytes.begin()));
  return bytes;
}

platform::Bytes requestFrame(const Value& body) {
  platform::Bytes encoded;
  platform::encodeValue(body, encoded);
  return frame({.id = 1}, encoded);
}

Client::Client(const std::string& runtime, const std::string& service)
    : connection_(platform::ipcConnectService(runtime, service, queue_)) {
  connection_->setEventHandler([](const platform::IpcEvent&) {});
  connection_->resume();
}

Client::Client(platform::UniqueFd socket) : connection_(platform::ipcConnectionOverSocket(std::move(socket), queue_)) {
  connection_->setEventHandler([](const platform::IpcEvent&) {});
  connection_->resume();
}

Client::~Client() {
  connection_->cancel();
}

Value Client::send(const Dictionary& request) {
  const auto reply = connection_->sendWithReplySync(request);
  EXPECT_FALSE(reply.error) << reply.describe();
  return reply.body;
}

Value Client::request(std::string_view type, Dictionary entries) {
  entries.set("request", type);
  if (!entries.contains("version")) entries.set("version", std::uint64_t{3});
  return send(entries);
}

Array Client::match(const Dictionary& rules, std::uint64_t flags) {
  const Value reply = request("match", {{"rules", rules}, {"flags", flags}});
  EXPECT_TRUE(reply["error"].isNothing()) << reply.describe();
  return Array(platform::fromWireMessage(reply["matches"]));
}

std::vector<std::string> Client::offered(const Dictionary& rules, std::uint64_t flags) {
  std::vector<std::string> texts;
  for (const Value& form : match(rules, flags)) {
    texts.push_back(form["identifier"].string() + " " + form["version"].string());
  }
  std::sort(texts.begin(), texts.end());
  return texts;
}

Daemon::Daemon() {
  std::string pattern = (std::filesystem::temp_directory_path() / "extora.XXXXXX").string();
  if (::mkdtemp(pattern.data()) == nullptr) std::abort();
  root_ = std::filesystem::canonical(pattern);
  for (const auto& place : {config() / "preferences", applications(), systemApplications(), systemPlugIns(),
                            extensionPoints(), root_ / "profiles"}) {
    std::filesystem::create_directories(place);
  }
  environment_ = {{"EXTORA_RUNTIME_DIR", runtime()},
                  {"EXTORA_STATE_DIR", state()},
                  {"EXTORA_CONFIG_DIR", config()},
                  {"EXTORA_APPLICATIONS", applications()},
                  {"EXTORA_SYSTEM_APPLICATIONS", systemApplications()},
                  {"EXTORA_SYSTEM_PLUGINS", systemPlugIns()},
                  {"EXTORA_EXTENSION_POINTS", extensionPoints()},
                  {"EXTORA_GLOBAL_ANNOTATIONS", root_ / "Extora-Annotations"},
                  {"EXTORA_PROFILES", root_ / "profiles"},
                  {"EXTORA_PLUGIN_USER", std::to_string(::getuid())},
                  {"EXTORA_MULTI_USER", "0"},
                  {"EXTORA_LOG", "debug"},
                  {"EXTORA_INTERNAL_DIAGNOSTICS", "0"},
                  {"EXTORA_TERMINATION_GRACE_MS", "5000"},
                  {"LANG", "C.UTF-8"}};
}

Daemon::~Daemon() {
  if (process_) stop();
  if (::testing::Test::HasFailure()) std::cerr << "--- log of the daemon\n" << log() << "---\n";
  std::error_code ignored;
  std::filesystem::remove_all(root_, ignored);
}

std::filesystem::path Daemon::socket(const std::string& service) const {
  return runtime() / "services" / service;
}

void Daemon::start(const std::vector<std::string>& arguments) {
  const auto notifyPath = root_ / "ready";
  std::filesystem::remove(notifyPath);
  const auto address = addressOf(notifyPath);
  const platform::UniqueFd ready(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::bind(ready.get(), generic(address), sizeof address), 0) << std::strerror(errno);
  auto environment = environment_;
  environment["NOTIFY_SOCKET"] = notifyPath;
  std::vector<std::string> all{XTD_BINARY};
  all.insert(all.end(), arguments.begin(), arguments.end());
  process_ = std::make_unique<RunningProgram>(all, environment, STDERR_FILENO);
  pollfd events[] = {{ready.get(), POLLIN, 0}, {process_->pidfd(), POLLIN, 0}};
  ASSERT_GT(::poll(events, 2, kDeadlineMs), 0) << "the daemon does not get ready";
  ASSERT_NE(events[0].revents, 0) << "the daemon ended with status " << process_->wait();
}

int Daemon::run(const std::vector<std::string>& arguments) {
  std::vector<std::string> all{XTD_BINARY};
  all.insert(all.end(), arguments.begin(), arguments.end());
  process_ = std::make_unique<RunningProgram>(all, environment_, STDERR_FILENO);
  return process_->wait();
}

int Daemon::stop() {
  process_->signal(SIGTERM);
  const int status = process_->wait();
  if (status != 0) std::cerr << "--- log of the daemon that ended with status " << status << "\n" << log() << "---\n";
  return status;
}

bool Daemon::waitForLog(std::string_view text, std::size_t count) {
  return process_->waitForOutput(text, count);
}

std::size_t Daemon::countInLog(std::string_view text) const {
  return countOf(log(), text);
}

platform::UniqueFd Daemon::connectRaw() const {
  platform::UniqueFd fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  EXPECT_TRUE(connectSocket(fd.get())) << std::strerror(errno);
  const timeval limit{kDeadline.count(), 0};
  ::setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
  return fd;
}

bool Daemon::connectSocket(int fd) const {
  const auto address = addressOf(socket());
  return ::connect(fd, generic(address), sizeof address) == 0;
}

std::string Daemon::hostProgram() {
  return TEST_HOST_BINARY;
}

std::string Daemon::writeHost(const std::string& name, const Value& entitlements,
                              std::vector<SampleBundle> plugIns) const {
  SampleBundle application = sampleApplication("com.example." + name, std::move(plugIns));
  application.info.set("HBBundleExecutable", "host");
  application.program = hostProgram();
  application.entitlements = entitlements;
  return writeBundle(applications(), application) + "/host";
}

std::uint64_t Daemon::notificationCount(const std::string& name) const {
  std::ifstream file(runtime() / "notify" / name, std::fstream::binary);
  unsigned char bytes[8] = {};
  EXPECT_TRUE(file.read(reinterpret_cast<char*>(bytes), sizeof bytes)) << "no notification " << name;
  std::uint64_t count = 0;
  for (int i = 7; i >= 0; --i) count = count << 8 | bytes[i];
  return count;
}

Host::Host(const Daemon& daemon, const std::filesystem::path& executable, std::vector<std::string> before)
    : Host(socketPair(), [&] {
        before.insert(before.end(), {executable, daemon.runtime(), Daemon::kService});
        return before;
      }()) {}

Host::Host(SocketPair sockets, const std::vector<std::string>& command)
    : Client(std::move(sockets.first)), program_(command, {}, STDERR_FILENO, sockets.second.get()) {}

}  // namespace tests
