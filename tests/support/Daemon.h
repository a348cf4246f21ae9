// Daemon: a real xtd, the shipped binary, in private directories under one temporary folder.
//
// A test lays out what it needs (bundles, preferences), starts the daemon, talks to it, stops it. Nothing sleeps: every
// wait has a condition and a deadline, and the daemon's log is printed when a test has failed. For one thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/ipc/IpcFrame.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/Value.h"
#include "tests/support/RunningProgram.h"
#include "tests/support/SampleBundles.h"

namespace tests {

using platform::Array;
using platform::Dictionary;
using platform::Value;

using SocketPair = std::pair<platform::UniqueFd, platform::UniqueFd>;
/// Two sockets that are connected with each other.
SocketPair socketPair();

/// "CODE TEXT" of a refused request's reply; "" when it was served.
std::string failureOf(const Value& reply);

/// A frame of any kind; its length is that of `body`.
platform::Bytes frame(platform::IpcFrameHeader header, const platform::Bytes& body);
/// The frame of a request with the id 1.
platform::Bytes requestFrame(const Value& body);

/// One connection to the daemon.
class Client {
 public:
  Client(const std::string& runtime, const std::string& service);
  /// Over a connected socket.
  explicit Client(platform::UniqueFd socket);
  ~Client();
  /// Sends `request` and waits for its reply dictionary; fails the test when the connection broke instead.
  Value send(const Dictionary& request);
  /// As send, of a request of `type` and version 3 with further entries.
  Value request(std::string_view type, Dictionary entries = {});
  /// The forms of a "match"; fails the test when the daemon refused it.
  Array match(const Dictionary& rules, std::uint64_t flags = 0);
  /// "identifier version" of each of them, sorted.
  std::vector<std::string> offered(const Dictionary& rules = {}, std::uint64_t flags = 0);
  platform::IpcConnection& connection() { return *connection_; }
  platform::SerialQueue& queue() { return queue_; }

 private:
  platform::SerialQueue queue_{"test client"};
  std::shared_ptr<platform::IpcConnection> connection_;
};

class Daemon {
 public:
  static constexpr const char* kService = "com.orvane.extora.xtd";

  /// Makes the folders; starts nothing.
  Daemon();
  /// Stops the daemon, prints its log when the test has failed, and removes the folder.
  ~Daemon();

  // Places, all below root().
  const std::filesystem::path& root() const { return root_; }
  std::filesystem::path runtime() const { return root_ / "run"; }
  std::filesystem::path state() const { return root_ / "state"; }
  std::filesystem::path config() const { return root_ / "config"; }
  std::filesystem::path applications() const { return root_ / "Applications"; }
  std::filesystem::path systemApplications() const { return root_ / "System" / "Applications"; }
  std::filesystem::path systemPlugIns() const { return root_ / "System" / "PlugIns"; }
  std::filesystem::path extensionPoints() const { return root_ / "System" / "ExtensionPoints"; }
  std::filesystem::path socket(const std::string& service = kService) const;

  /// Sets a variable of the daemons to be started.
  void setEnvironment(const std::string& name, const std::string& value) { environment_[name] = value; }
  const std::map<std::string, std::string>& environment() const { return environment_; }

  /// Starts the daemon and waits until it says that it is ready.
  void start(const std::vector<std::string>& arguments = {});
  /// Starts a daemon that is not expected to serve, and answers its exit status; output() has what it said.
  int run(const std::vector<std::string>& arguments);
  /// Ends it with SIGTERM; its exit status.
  int stop();
  RunningProgram& process() { return *process_; }

  std::string log() const { return process_ ? process_->output() : std::string(); }
  [[nodiscard]] bool waitForLog(std::string_view text, std::size_t count = 1);
  std::size_t countInLog(std::string_view text) const;

  Client connect(const std::string& service = kService) const { return {runtime().string(), service}; }
  /// A raw connected socket, for bytes that no client would send.
  platform::UniqueFd connectRaw() const;
  /// Connects a socket that somebody else has made; callable in a forked process.
  bool connectSocket(int fd) const;
  /// The program of the tests' host (tests/system/TestHost.cpp), to be put into a bundle or beside entitlements.
  static std::string hostProgram();
  /// Writes an application "com.example.<name>" with that program in it; the program's path.
  std::string writeHost(const std::string& name, const Value& entitlements = {},
                        std::vector<SampleBundle> plugIns = {}) const;
  /// How often the system-wide notification has been posted.
  std::uint64_t notificationCount(const std::string& name) const;

 private:
  std::filesystem::path root_;
  std::map<std::string, std::string> environment_;
  std::unique_ptr<RunningProgram> process_;
};

/// A host process that runs with the daemon's environment and sends what it is given as its own requests.
class Host : public Client {
 public:
  /// Runs a copy of the tests' host. `before` is a program, with arguments, that sets the scene and executes it.
  Host(const Daemon& daemon, const std::filesystem::path& executable, std::vector<std::string> before = {});
  pid_t pid() const { return program_.pid(); }

 private:
  Host(SocketPair sockets, const std::vector<std::string>& command);
  RunningProgram program_;
};

}  // namespace tests
