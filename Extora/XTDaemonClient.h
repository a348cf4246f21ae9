// XTDaemonClient: the host side of the wire protocol: builds requests, sends them to the daemon's named service, and
// decodes what comes back.
//
// Replies of asynchronous requests and connection events run on the serial queue "xtd_client", one at a time; a
// synchronous request blocks its calling thread and runs the reply function there. Each reply function is called
// exactly once. A client never reconnects. It may be released while requests are outstanding: the connection is closed
// when neither the client nor an outstanding request needs it any more. Safe for use by several threads.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "Extora/XTError.h"
#include "Extora/XTProtocol.h"
#include "platform/ipc/IpcConnection.h"
#include "platform/queue/Mutex.h"
#include "platform/queue/SerialQueue.h"
#include "platform/value/Url.h"
#include "platform/value/Uuid.h"
#include "platform/value/Value.h"

namespace extora {

class XTDaemonClient {
 public:
  using Dictionary = platform::Dictionary;
  using Url = platform::Url;
  using Uuid = platform::Uuid;
  using Value = platform::Value;
  /// Given the raw reply: a reply dictionary or an IPC error; decode it with errorInReply and convertFromIPC.
  using Reply = std::function<void(const platform::IpcReplyObject& reply)>;
  /// Bundle path and UUID of each plug-in.
  using PlugIns = std::vector<std::pair<std::string, Uuid>>;

  /// A client bound to the named service, by default "com.orvane.extora.xtd". Never null.
  static std::shared_ptr<XTDaemonClient> initWithServiceName(const std::optional<std::string>& serviceName);

  void addPlugIns(const std::vector<std::string>& paths, const Reply& reply);
  void removePlugIns(const std::vector<std::string>& paths, const Reply& reply);
  void bulkPlugins(std::uint64_t flags, const Reply& reply);
  /// `environment`: a dictionary, or nothing for none.
  void readyPlugIns(const PlugIns& plugIns, bool synchronously, std::uint64_t flags, const Value& environment,
                    const Reply& reply);
  void accessPlugIns(const PlugIns& plugIns, bool synchronously, std::uint64_t flags, const Reply& reply);
  void findPlugInByUUID(const Uuid& uuid, const Reply& reply);
  void findPlugInByPathURL(const Url& url, const Reply& reply);
  /// Synchronous when flag bit XTDiscoverSynchronously (0x400) is set.
  void matchPlugIns(const Dictionary& rules, std::uint64_t flags, const Reply& reply);
  void setPluginAnnotations(const std::vector<Uuid>& uuids, const Dictionary& annotations, const Reply& reply);
  void bulkSetPluginAnnotations(const Dictionary& annotations, const Reply& reply);
  void holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags, const Reply& reply);
  void releaseHold(const Uuid& token, const Reply& reply);

  // Building blocks.
  /// A new request of exactly two entries: its type and the protocol version.
  Dictionary request(std::string_view type) const;
  Dictionary request(std::string_view type, const std::vector<std::string>& paths) const;
  /// Sets "uuids" and "paths", whose entries at one index come from the same pair.
  static void setPlugins(Dictionary& request, const PlugIns& plugIns);
  static void setUuids(Dictionary& request, const std::vector<Uuid>& uuids);
  /// sendSynchronously(false, ...).
  void send(Dictionary request, const Reply& reply);
  /// Synchronously: adds "sync", waits, and calls `reply` on this thread before it returns.
  void sendSynchronously(bool synchronously, Dictionary request, const Reply& reply);

  // Decoding.
  /// Nothing when the request succeeded. A failed transport is code 4 with the reason as its text. An error text
  /// without a code is a broken contract of the daemon.
  static std::optional<Error> errorInReply(const platform::IpcReplyObject& reply);
  /// One wire message carrying `value` when `version` is 3, else nothing.
  static Value convertToIPC(const Value& value, std::uint64_t version);
  /// The value again when this client speaks version 3, else nothing.
  Value convertFromIPC(const Value& message) const;

  std::shared_ptr<platform::IpcConnection> xtd() const;
  void setXtd(std::shared_ptr<platform::IpcConnection> connection);
  std::shared_ptr<platform::SerialQueue> replyQueue() const;
  void setReplyQueue(std::shared_ptr<platform::SerialQueue> queue);
  std::int64_t protocolVersion() const { return protocolVersion_; }
  void setProtocolVersion(std::int64_t version) { protocolVersion_ = version; }

 private:
  XTDaemonClient() = default;
  mutable platform::Mutex mutex_;
  std::shared_ptr<platform::SerialQueue> replyQueue_ XT_GUARDED_BY(mutex_);
  std::shared_ptr<platform::IpcConnection> xtd_ XT_GUARDED_BY(mutex_);
  std::int64_t protocolVersion_ = XTDProtocolVersion;
};

}  // namespace extora
