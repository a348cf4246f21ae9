// Who keeps what alive: the client and each outstanding asynchronous request hold the connection through a handle that
// cancels it when its last copy goes; the connection's event handler holds the queue, so that the queue outlives it.
#include "Extora/XTDaemonClient.h"

#include <atomic>

#include "Extora/XTLog.h"
#include "Extora/XTUtilities.h"
#include "platform/files/Directories.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/value/InternalInconsistency.h"
#include "platform/value/PropertyListKinds.h"

namespace extora {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::IpcConnection;
using platform::IpcReplyObject;
using platform::LogLevel;
using platform::SerialQueue;
using platform::Uuid;
using platform::Value;

std::shared_ptr<IpcConnection> connectService(const std::string& service, std::shared_ptr<SerialQueue> queue) {
  const std::string runtime = platform::Directories::forClient(service).runtime;
  std::shared_ptr<IpcConnection> connection = platform::ipcConnectService(runtime, service, *queue);
  const auto closed = std::make_shared<std::atomic<bool>>(false);
  connection->setEventHandler([queue = std::move(queue), closed](const platform::IpcEvent& event) {
    // What the client itself ended is no event of the service.
    if (!*closed) XTLogOps().error("Communications error: {}", platform::describe(event));
  });
  connection->resume();
  IpcConnection* const bare = connection.get();
  return {bare, [connection = std::move(connection), closed](IpcConnection*) {
            *closed = true;
            connection->cancel();
          }};
}

// The value as the wire carries it: descriptors and messages, at any depth, are left out.
Value toWireValue(const Value& value) {
  return platform::convertLeaves(
      value, [](const Value& leaf) { return leaf.isMessage() || leaf.isDescriptor() ? Value() : leaf; });
}

Value pathArray(const std::vector<std::string>& paths) {
  return arrayWithValues(paths, [](const std::string& path) { return Value(path); });
}

// What a reply looks like in the log: of the sandbox tokens that "access" answers only the beginning is shown.
IpcReplyObject withoutTokens(const IpcReplyObject& reply) {
  constexpr std::size_t kShown = 8;
  const Value& tokens = reply.body[XTDExtensionsKey];
  if (!tokens.isArray()) return reply;
  Dictionary body(reply.body);
  body.set(XTDExtensionsKey, arrayWithValues(tokens.items(), [](const Value& token) {
             return token.string().size() > kShown ? Value(token.string().substr(0, kShown) + "...") : token;
           }));
  return {std::move(body), reply.error};
}

void deliver(const XTDaemonClient::Reply& reply, const IpcReplyObject& object) {
  if (XTLogTraffic().enabled(LogLevel::Debug)) XTLogTraffic().debug("reply: {}", withoutTokens(object));
  if (reply) reply(object);
}

}  // namespace

std::shared_ptr<XTDaemonClient> XTDaemonClient::initWithServiceName(const std::optional<std::string>& serviceName) {
  std::shared_ptr<XTDaemonClient> client(new XTDaemonClient());
  auto queue = std::make_shared<SerialQueue>("xtd_client");
  client->setXtd(connectService(serviceName.value_or(std::string(XTDDefaultServiceName)), queue));
  client->setReplyQueue(std::move(queue));
  return client;
}

void XTDaemonClient::addPlugIns(const std::vector<std::string>& paths, const Reply& reply) {
  send(request(XTDAddRequest, paths), reply);
}

void XTDaemonClient::removePlugIns(const std::vector<std::string>& paths, const Reply& reply) {
  send(request(XTDRemoveRequest, paths), reply);
}

void XTDaemonClient::bulkPlugins(std::uint64_t flags, const Reply& reply) {
  Dictionary message = request(XTDBulkRequest);
  message.set(XTDFlagsKey, flags);
  send(std::move(message), reply);
}

void XTDaemonClient::readyPlugIns(const PlugIns& plugIns, bool synchronously, std::uint64_t flags,
                                  const Value& environment, const Reply& reply) {
  Dictionary message = request(XTDReadyRequest);
  message.set(XTDFlagsKey, flags);
  if (!environment.isNothing()) message.set(XTDEnvironmentKey, toWireValue(environment));
  setPlugins(message, plugIns);
  sendSynchronously(synchronously, std::move(message), reply);
}

void XTDaemonClient::accessPlugIns(const PlugIns& plugIns, bool synchronously, std::uint64_t flags,
                                   const Reply& reply) {
  Dictionary message = request(XTDAccessRequest);
  message.set(XTDFlagsKey, flags);
  setPlugins(message, plugIns);
  sendSynchronously(synchronously, std::move(message), reply);
}

void XTDaemonClient::findPlugInByUUID(const Uuid& uuid, const Reply& reply) {
  XTLogOps().def("findPlugInByUUID {}", uuid);
  Dictionary message = request(XTDFindRequest);
  message.set(XTDUUIDKey, uuid);
  send(std::move(message), reply);
}

void XTDaemonClient::findPlugInByPathURL(const Url& url, const Reply& reply) {
  XTLogOps().def("findPlugInByPathURL {}", url);
  Dictionary message = request(XTDFindRequest);
  message.set(XTDPathsKey, url.absoluteString());
  send(std::move(message), reply);
}

void XTDaemonClient::matchPlugIns(const Dictionary& rules, std::uint64_t flags, const Reply& reply) {
  Dictionary message = request(XTDMatchRequest);
  message.set(XTDRulesKey, toWireValue(rules));
  message.set(XTDFlagsKey, flags);
  sendSynchronously((flags & XTDiscoverSynchronously) != 0, std::move(message), reply);
}

void XTDaemonClient::setPluginAnnotations(const std::vector<Uuid>& uuids, const Dictionary& annotations,
                                          const Reply& reply) {
  Dictionary message = request(XTDAnnotateRequest);
  setUuids(message, uuids);
  message.set(XTDAnnotationsKey, toWireValue(annotations));
  send(std::move(message), reply);
}

void XTDaemonClient::bulkSetPluginAnnotations(const Dictionary& annotations, const Reply& reply) {
  Dictionary message = request(XTDBulkAnnotateRequest);
  message.set(XTDAnnotationsKey, toWireValue(annotations));
  send(std::move(message), reply);
}

void XTDaemonClient::holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags, const Reply& reply) {
  Dictionary message = request(XTDLockdownRequest, paths);
  message.set(XTDFlagsKey, flags);
  send(std::move(message), reply);
}

void XTDaemonClient::releaseHold(const Uuid& token, const Reply& reply) {
  Dictionary message = request(XTDLockdownRequest);
  setUuids(message, {token});
  send(std::move(message), reply);
}

Dictionary XTDaemonClient::request(std::string_view type) const {
  return {{XTDRequestKey, type}, {XTDVersionKey, static_cast<std::uint64_t>(protocolVersion_)}};
}

Dictionary XTDaemonClient::request(std::string_view type, const std::vector<std::string>& paths) const {
  Dictionary message = request(type);
  message.set(XTDPathsKey, pathArray(paths));
  return message;
}

void XTDaemonClient::setPlugins(Dictionary& request, const PlugIns& plugIns) {
  Array uuids;
  Array paths;
  for (const auto& [path, uuid] : plugIns) {
    uuids.append(uuid);
    paths.append(path);
  }
  request.set(XTDUUIDKey, std::move(uuids));
  request.set(XTDPathsKey, std::move(paths));
}

void XTDaemonClient::setUuids(Dictionary& request, const std::vector<Uuid>& uuids) {
  request.set(XTDUUIDKey, arrayWithValues(uuids, [](const Uuid& uuid) { return Value(uuid); }));
}

void XTDaemonClient::send(Dictionary request, const Reply& reply) {
  sendSynchronously(false, std::move(request), reply);
}

void XTDaemonClient::sendSynchronously(bool synchronously, Dictionary request, const Reply& reply) {
  if (XTLogTraffic().enabled(LogLevel::Debug)) XTLogTraffic().debug("request: {}", Value(request));
  std::shared_ptr<IpcConnection> connection = xtd();
  if (synchronously) {
    request.set(XTDSynchronousRequestKey, true);
    deliver(reply, connection->sendWithReplySync(std::move(request)));
    return;
  }
  std::shared_ptr<SerialQueue> queue = replyQueue();
  const SerialQueue& target = *queue;
  IpcConnection& bare = *connection;
  bare.sendWithReply(std::move(request), target,
                     [connection = std::move(connection), queue = std::move(queue),
                      reply](const IpcReplyObject& object) { deliver(reply, object); });
}

std::optional<Error> XTDaemonClient::errorInReply(const IpcReplyObject& reply) {
  if (reply.error) return makeError(XTErrorRequest, reply.error->describe());
  const std::uint64_t code = reply.body[XTDErrorCodeKey].exactUnsigned();
  const Value& text = reply.body[XTDErrorKey];
  if (code != 0) {
    return makeError(static_cast<std::int64_t>(code),
                     text.isString() ? text.string() : "unknown error returned by Extora subsystem");
  }
  if (!text.isString()) return std::nullopt;
  throw platform::InternalInconsistency("xtd reported error without a code: " + text.string());
}

Value XTDaemonClient::convertToIPC(const Value& value, std::uint64_t version) {
  if (version != XTDProtocolVersion || value.isNothing()) return {};
  return platform::toWireMessage(value);
}

Value XTDaemonClient::convertFromIPC(const Value& message) const {
  if (protocolVersion_ != static_cast<std::int64_t>(XTDProtocolVersion)) return {};
  return platform::fromWireMessage(message);
}

std::shared_ptr<IpcConnection> XTDaemonClient::xtd() const {
  const platform::MutexLock lock(mutex_);
  return xtd_;
}

void XTDaemonClient::setXtd(std::shared_ptr<IpcConnection> connection) {
  const platform::MutexLock lock(mutex_);
  xtd_.swap(connection);
}

std::shared_ptr<SerialQueue> XTDaemonClient::replyQueue() const {
  const platform::MutexLock lock(mutex_);
  return replyQueue_;
}

void XTDaemonClient::setReplyQueue(std::shared_ptr<SerialQueue> queue) {
  const platform::MutexLock lock(mutex_);
  replyQueue_.swap(queue);
}

}  // namespace extora
