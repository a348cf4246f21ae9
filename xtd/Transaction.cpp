// A request's road: dispatch looks the type up in one table and calls one handler; the handler walks the request's
// paths or UUIDs with the steps below and ends in done() or fail(), which send the one reply.
#include "xtd/Transaction.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdlib>

#include "Extora/XTLog.h"
#include "platform/value/InternalInconsistency.h"
#include "xtd/Probes.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {
namespace {

// Ends the program where that helps, in debug builds; elsewhere the other clients are worth more than a stack trace.
void brokenContract(const char* description) {
  XTLogOps().fault("internal inconsistency: {}", description);
#ifndef NDEBUG
  platform::Log::flush();
  std::abort();
#endif
}

}  // namespace

std::span<const Transaction::Handler> Transaction::handlers() {
  static constexpr Handler table[] = {
      {XTDAddRequest, &Transaction::addPlugIns},           {XTDRemoveRequest, &Transaction::removePlugIns},
      {XTDBulkRequest, &Transaction::bulkPlugIns},         {XTDMatchRequest, &Transaction::matchPlugIns},
      {XTDReadyRequest, &Transaction::readyPlugIns},       {XTDAccessRequest, &Transaction::accessPlugIns},
      {XTDAnnotateRequest, &Transaction::annotatePlugIns}, {XTDBulkAnnotateRequest, &Transaction::bulkAnnotatePlugIns},
      {XTDLockdownRequest, &Transaction::lockDownPlugIns}, {XTDFindRequest, &Transaction::findPlugIn},
  };
  return table;
}

std::shared_ptr<Transaction> Transaction::initWithRequest(platform::IpcMessage request,
                                                          std::shared_ptr<XTDIpcClient> client) {
  return std::shared_ptr<Transaction>(new Transaction(std::move(request), std::move(client)));
}

Transaction::Transaction(platform::IpcMessage request, std::shared_ptr<XTDIpcClient> client)
    : request_(std::move(request)), reply_(platform::ipcCreateReply(request_)), client_(std::move(client)) {}

Transaction::~Transaction() {
  if (!answered_.load() && client_->acceptWork()) brokenContract("transaction destroyed unanswered");
}

XTDServer& Transaction::server() const {
  return *client_->server();
}

std::shared_ptr<platform::IpcConnection> Transaction::connection() const {
  return client_->connection();
}

void Transaction::dispatch() {
  const Value& type = request()[XTDRequestKey];
  version_ = request()[XTDVersionKey].exactUnsigned();
  if (version_ < XTDOldestProtocolVersion || version_ > XTDProtocolVersion) {
    fail(XTErrorVersion, fmt::format("unsupported protocol version {} (current {})", version_, XTDProtocolVersion));
    return;
  }
  if (!client_->acceptWork()) return;
  XTLogOps().debug("client {} requested {}", client_->pid(), type.isString() ? type : Value());
  probes::request(client_->pid(), type.isString() ? type.string().c_str() : nullptr);
  if (!type.isString()) {
    fail(XTErrorRequest, "invalid request format (missing type)");
    return;
  }
  const auto table = handlers();
  const auto found = std::find_if(table.begin(), table.end(), [&](const auto& h) { return h.type == type.string(); });
  if (found == table.end()) {
    fail(XTErrorRequest, "unrecognized request");
    return;
  }
  (this->*found->call)();
}

bool Transaction::marshalPaths(const PathVisitor& visitor) {
  const Value& paths = request()[XTDPathsKey];
  if (!paths.isArray()) {
    fail(XTErrorRequest, "invalid request format");
    return false;
  }
  for (const Value& element : paths.items()) {
    if (!element.isString()) {
      fail(XTErrorRequest, "invalid request format");
      return false;
    }
    const std::string& path = element.string();
    if (!path.starts_with('/')) {
      fail(XTErrorPath, fmt::format("absolute path required: {}", path));
      return false;
    }
    const auto resolved = server().platformServices()->files->resolvePath(path);
    if (!visitor(resolved.value_or(path), resolved.has_value())) return false;
  }
  return true;
}

bool Transaction::processPaths(const PathVisitor& visitor) {
  const bool finished = marshalPaths(visitor);
  if (finished) done();
  return finished;
}

Value Transaction::usablePaths(std::size_t count) const {
  const Value& paths = request()[XTDPathsKey];
  if (paths.isNothing()) return {};
  if (!paths.isArray()) {
    XTLogTraffic().def("Paths present but not an array (ignoring values)");
    return {};
  }
  if (paths.size() != count) {
    XTLogTraffic().def("Paths present but has different count than UUIDs (ignoring)");
    return {};
  }
  return paths;
}

bool Transaction::processUuidList(const PlugInVisitor& visitor) {
  const Value& uuids = request()[XTDUUIDKey];
  if (!uuids.isArray()) {
    fail(XTErrorRequest, "invalid request format (uuid)");
    return false;
  }
  const Value paths = usablePaths(uuids.size());
  for (std::size_t i = 0; i < uuids.size(); ++i) {
    if (!uuids.at(i).isUuid()) {
      fail(XTErrorRequest, "invalid request (bad uuid array)");
      return false;
    }
    const Uuid& uuid = uuids.at(i).uuid();
    auto plugIn = server().findPlugIn(uuid);
    if (plugIn == nullptr && paths.isArray()) {
      XTLogTraffic().info("Failed to find plugin by {}", uuid);
      if (const Value& path = paths.at(i); path.isString()) {
        XTLogTraffic().info("Looking for plugin {} by path {}", uuid, path.string());
        plugIn = server().findPlugInAtPath(Url::file(path.string()));
      }
    }
    if (plugIn == nullptr) {
      fail(XTErrorRequest, "no such plugin (uuid not found)");
      return false;
    }
    if (!visitor(plugIn)) return false;
  }
  return true;
}

void Transaction::done() {
  if (answered_.exchange(true)) {
    brokenContract("transaction answered twice");
    return;
  }
  if (probes::requestOutputEnabled()) probes::requestOutput(client_->pid(), Value(reply_.body).describe());
  if (const auto connection = this->connection()) connection->send(reply_);
}

void Transaction::fail(std::uint64_t code, const std::string& message) {
  reply_.body.set(XTDErrorCodeKey, code);
  reply_.body.set(XTDErrorKey, message);
  done();
}

void Transaction::fail(std::uint64_t code, const Error& error) {
  const bool own = error.domain == XTExtoraErrorDomain;
  fail(own ? static_cast<std::uint64_t>(error.code) : code, error.localizedDescription());
}

void Transaction::finishForm(const XTDPlugIn& plugIn, platform::Dictionary& form) {
  addAnnotationForPlugIn(plugIn, form);
  plugIn.augmentForm(*server().platformServices()->sandbox, form);
}

void Transaction::addAnnotationForPlugIn(const XTDPlugIn& plugIn, platform::Dictionary& form) {
  Value annotation = server().annotationForPlugIn(plugIn);
  if (annotation.isNothing()) annotation = platform::Dictionary();
  form.set(XTAnnotationsFormKey, std::move(annotation));
}

}  // namespace extora
