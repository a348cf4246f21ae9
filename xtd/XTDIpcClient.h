// XTDIpcClient: one connected host: who it is, what it may, its requests, and its end.
//
// The connection keeps the client alive (context object and event handler); the client refers to the connection weakly.
// Events of one connection come in order; requestCount changes only on the service queue.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

#include "Extora/XTBundle.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/signing/CodeSigning.h"
#include "platform/value/Value.h"

namespace extora {

class Transaction;
class XTDServer;

class XTDIpcClient : public std::enable_shared_from_this<XTDIpcClient> {
 public:
  /// Null when the peer's executable cannot be told (logged): the caller cancels the connection.
  static std::shared_ptr<XTDIpcClient> initWithConnection(const std::shared_ptr<platform::IpcConnection>& connection,
                                                          const std::shared_ptr<XTDServer>& server);
  ~XTDIpcClient();

  /// The peer's process id, asked of the connection each time; 0 when the connection has gone.
  pid_t pid() const;
  /// The process id that the peer had when it connected, also after the connection has gone.
  pid_t originalPid() const { return peer_->pid(); }
  /// The process at the other end, held by pidfd. Never null.
  const std::shared_ptr<const platform::PeerIdentity>& peer() const { return peer_; }
  const std::string& path() const { return path_; }
  const std::shared_ptr<XTBundle>& bundle() const { return bundle_; }
  /// Null when it has gone.
  std::shared_ptr<platform::IpcConnection> connection() const { return connection_.lock(); }
  const std::shared_ptr<XTDServer>& server() const { return server_; }
  /// False once the connection has been found invalid.
  bool acceptWork() const { return acceptWork_.load(std::memory_order_relaxed); }
  std::uint32_t requestCount() const { return requestCount_.load(std::memory_order_relaxed); }

  /// Any property-list value, or nothing. Asks again on every call; a look-up error is logged.
  platform::Value entitlementValueForKey(const std::string& name);
  /// Present and not equal to boolean false (0 counts as false).
  bool hasEntitlement(const std::string& name);
  bool isSandboxed() const;

  /// The peer announced that it is about to end: only logged.
  void dying();
  /// The connection is invalid: releases this client's holds and refuses further work.
  void dead();

  std::string describe() const;

 private:
  XTDIpcClient() = default;
  void handleEvent(const platform::IpcEvent& event);
  /// The work item of one request: counts it and dispatches it. On the service queue.
  void serve(Transaction& transaction);

  std::shared_ptr<XTBundle> bundle_;
  std::atomic<bool> acceptWork_{true};
  std::atomic<std::uint32_t> requestCount_{0};
  std::weak_ptr<platform::IpcConnection> connection_;
  std::shared_ptr<const platform::PeerIdentity> peer_;
  std::shared_ptr<XTDServer> server_;
  std::string path_;
  std::shared_ptr<platform::CodeSigningTask> task_;
};

}  // namespace extora
