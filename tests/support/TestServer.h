// TestServer: the daemon's server over a TestPlatform, listening for nobody until it is resumed, and FakeConnections
// through which a test plays its clients. A request that a test delivers has been served when deliver() returns. For
// one thread.
#pragma once

#include <unistd.h>

#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/queue/MainRunLoop.h"
#include "tests/support/TestPlatform.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace tests {

/// A connection of which the test is the other end.
class FakeConnection : public platform::IpcConnection {
 public:
  explicit FakeConnection(std::shared_ptr<const platform::PeerIdentity> peer = platform::PeerIdentity::ofSelf())
      : peer_(std::move(peer)) {}

  const std::shared_ptr<const platform::PeerIdentity>& peer() const override { return peer_; }
  pid_t peerPid() const override { return valid ? peer_->pid() : 0; }
  void setEventHandler(Handler handler) override { handler_ = std::move(handler); }
  void setContext(std::shared_ptr<void> context) override { context_ = std::move(context); }
  void resume() override {}
  void cancel() override { valid = false; }
  bool isValid() const override { return valid; }
  void send(const platform::IpcReply& reply) override { replies.push_back(reply); }
  void sendWithReply(const platform::Value&, const platform::SerialQueue&, ReplyFunction) override {}
  platform::IpcReplyObject sendWithReplySync(const platform::Value&) override { return {}; }
  void sendWithoutReply(const platform::Value&) override {}
  void announceTermination() override {}
  std::string describe() const override { return "fake"; }

  void deliver(const platform::IpcEvent& event) const { handler_(event); }
  /// The connection's end, as the IPC layer delivers it.
  void end() {
    valid = false;
    handler_(platform::IpcError{platform::IpcError::Kind::ConnectionInvalid, "gone"});
    handler_ = nullptr;
    context_ = nullptr;
  }

  bool valid = true;
  std::vector<platform::IpcReply> replies;

 private:
  const std::shared_ptr<const platform::PeerIdentity> peer_;
  Handler handler_;
  std::shared_ptr<void> context_;
};

/// Entitlements that every client has, and whether every client is sandboxed.
class FakeRights : public platform::CodeSigning, public platform::Sandbox {
 public:
  std::shared_ptr<platform::CodeSigningTask> taskForAuditToken(
      const std::shared_ptr<const platform::PeerIdentity>&) override {
    if (!hasTasks) return nullptr;
    return std::make_shared<Task>(*this);
  }
  bool isSandboxedByAuditToken(const platform::PeerIdentity&) override { return sandboxed; }

  platform::Dictionary entitlements;
  bool lookUpFails = false;
  bool hasTasks = true;
  bool sandboxed = false;

 private:
  struct Task : platform::CodeSigningTask {
    explicit Task(const FakeRights& from) : rights(from) {}
    platform::Value copyEntitlementValue(const std::string& name, platform::Error* error) override {
      if (rights.lookUpFails) platform::setError(error, {"Test", 1, "refused"});
      return rights.lookUpFails ? platform::Value() : rights.entitlements[name];
    }
    const FakeRights& rights;
  };
};

/// The user's preferences, as a dictionary of the one domain that there is.
class FakePreferences : public platform::Preferences {
 public:
  platform::Value preferenceValue(const std::string& domain, const std::string& key) override {
    return domain == "com.orvane.extora.userprefs" ? values[key] : platform::Value();
  }
  platform::Dictionary values;
};

class TestServer {
 public:
  TestServer() {
    platform::MainRunLoop::blockSignals();
    platform.services->directories.runtime = platform.directory.path("run");
    platform.services->preferences = preferences;
    platform.services->signing = rights;
    platform.services->sandbox = rights;
    server = make();
    server->setCacheLimit(100'000);
  }
  ~TestServer() {
    server->stop();
    server->ipcQueue().sync([] {});
  }

  /// A further server of the same service.
  std::shared_ptr<extora::XTDServer> make() const {
    return extora::XTDServer::initForService(platform.services, "test", platform.directory.path("db"));
  }
  std::shared_ptr<extora::XTDPlugIn> install(const platform::ARExtoraProxy& record) {
    return server->plugInForProxy(platform.registry->install(record));
  }
  std::shared_ptr<extora::XTDIpcClient> connect(const std::shared_ptr<FakeConnection>& connection) const {
    return extora::XTDIpcClient::initWithConnection(connection, server);
  }
  /// Waits until the service queue has done what was submitted to it.
  void drain() const {
    server->submitWork([] {}, true);
  }
  /// Delivers a request and answers its reply; nothing when there was none.
  platform::Value serve(FakeConnection& connection, const platform::Dictionary& request) const {
    connection.replies.clear();
    connection.deliver(platform::IpcMessage{1, true, request});
    drain();
    if (connection.replies.empty()) return {};
    return connection.replies.front().body;
  }

  TestPlatform platform;
  std::shared_ptr<FakeRights> rights = std::make_shared<FakeRights>();
  std::shared_ptr<FakePreferences> preferences = std::make_shared<FakePreferences>();
  std::shared_ptr<extora::XTDServer> server;
};

}  // namespace tests
