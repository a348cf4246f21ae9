#include "xtd/XTDIpcClient.h"

#include <fmt/format.h>

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "platform/files/ProcessPaths.h"
#include "xtd/Probes.h"
#include "xtd/Transaction.h"
#include "xtd/XTDServer.h"

namespace extora {
namespace {

// Every so many requests of one client are worth a line.
constexpr std::uint32_t kRequestsALine = 1000;

}  // namespace

std::shared_ptr<XTDIpcClient> XTDIpcClient::initWithConnection(
    const std::shared_ptr<platform::IpcConnection>& connection, const std::shared_ptr<XTDServer>& server) {
  std::shared_ptr<XTDIpcClient> client(new XTDIpcClient());
  client->connection_ = connection;
  client->peer_ = connection->peer();
  client->server_ = server;
  std::string path = platform::executablePathOfPid(*client->peer_);
  if (path.empty()) {
    XTLogOps().log(XTLogFaultOrError(), "Failed to get the file system path for the process with pid {}.",
                   client->originalPid());
    return nullptr;
  }
  const auto url = platform::Url::file(path);
  if (url.empty()) {
    XTLogOps().log(XTLogFaultOrError(), "Unable to get the file url from file system path.");
    return nullptr;
  }
  client->bundle_ = XTBundle::initWithExecutableURL(url);
  client->path_ = std::move(path);
  XTLogOps().debug("new client {} {}", client->originalPid(), client->path_);
  probes::clientNew(client->originalPid());
  client->task_ = server->platformServices()->signing->taskForAuditToken(client->peer_);
  connection->setContext(client);
  connection->setEventHandler([client](const platform::IpcEvent& event) { client->handleEvent(event); });
  connection->resume();
  return client;
}

XTDIpcClient::~XTDIpcClient() = default;

pid_t XTDIpcClient::pid() const {
  const auto connection = connection_.lock();
  return connection == nullptr ? 0 : connection->peerPid();
}

void XTDIpcClient::handleEvent(const platform::IpcEvent& event) {
  if (const auto* error = std::get_if<platform::IpcError>(&event)) {
    switch (error->kind) {
      case platform::IpcError::Kind::TerminationImminent:
        return dying();
      case platform::IpcError::Kind::ConnectionInvalid:
        return dead();
      case platform::IpcError::Kind::BrokenInput:
      case platform::IpcError::Kind::Other:
        XTLogOps().log(XTLogFaultOrError(), "unexpected error type from ipc: {}", *error);
        return;
    }
  }
  const auto* message = std::get_if<platform::IpcMessage>(&event);
  if (message == nullptr || !message->body.isDictionary()) {
    XTLogOps().log(XTLogFaultOrError(), "unexpected message: {} from: {}", platform::describe(event), pid());
    return;
  }
  if (probes::requestInputEnabled()) probes::requestInput(pid(), message->body.describe());
  auto transaction = Transaction::initWithRequest(*message, shared_from_this());
  const bool synchronously = message->body[XTDSynchronousRequestKey].exactBoolean();
  server_->submitWork([transaction = std::move(transaction)] { transaction->client()->serve(*transaction); },
                      synchronously);
}

void XTDIpcClient::serve(Transaction& transaction) {
  const std::uint32_t count = requestCount_.load(std::memory_order_relaxed) + 1;
  requestCount_.store(count, std::memory_order_relaxed);
  if (count % kRequestsALine == 0) XTLogOps().debug("client {} used {} requests so far", pid(), count);
  transaction.dispatch();
}

platform::Value XTDIpcClient::entitlementValueForKey(const std::string& name) {
  if (task_ == nullptr) return {};
  platform::Error error;
  auto value = task_->copyEntitlementValue(name, &error);
  if (!error.domain.empty()) XTLogOps().error("error retrieving entitlements for client {}", pid());
  return value;
}

bool XTDIpcClient::hasEntitlement(const std::string& name) {
  const auto value = entitlementValueForKey(name);
  return !value.isNothing() && !(value == platform::Value(false));
}

bool XTDIpcClient::isSandboxed() const {
  return server_->platformServices()->sandbox->isSandboxedByAuditToken(*peer_);
}

void XTDIpcClient::dying() {
  XTLogOps().debug("client {} termination imminent", pid());
}

void XTDIpcClient::dead() {
  server_->unholdClient(*this);
  XTLogOps().debug("client {} is dead", originalPid());
  acceptWork_.store(false, std::memory_order_relaxed);
  probes::clientDone(originalPid());
}

std::string XTDIpcClient::describe() const {
  const auto* address = static_cast<const void*>(this);
  const auto connection = connection_.lock();
  if (connection == nullptr) return fmt::format("<XTDIpcClient {} NO CONNECTION>", address);
  return fmt::format("<XTDIpcClient {} con={} pid={} path={}>", address, connection->describe(), pid(), path_);
}

}  // namespace extora
