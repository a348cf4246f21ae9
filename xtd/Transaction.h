// Transaction: one request being served. Made on the client connection's event thread, dispatched on the service queue;
// ends with exactly one done() or fail(), possibly later and from another queue. A transaction that is destroyed
// unanswered while its client lives, or answered twice, is a broken contract.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "Extora/XTError.h"
#include "Extora/XTProtocol.h"
#include "platform/ipc/IpcConnection.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

class XTDServer;
class XTDIpcClient;

class Transaction : public std::enable_shared_from_this<Transaction> {
 public:
  /// Given a path and whether it exists; answers whether to go on. A visitor that says stop has sent the failure.
  using PathVisitor = std::function<bool(const std::string& path, bool exists)>;
  using PlugInVisitor = std::function<bool(const std::shared_ptr<XTDPlugIn>& plugIn)>;

  /// The transaction of `request`, with its reply already created.
  static std::shared_ptr<Transaction> initWithRequest(platform::IpcMessage request,
                                                      std::shared_ptr<XTDIpcClient> client);
  ~Transaction();

  /// Checks version, liveness and type, then calls one handler. Called once, on the service queue.
  void dispatch();

  /// True when every path was visited and no visitor stopped; else the failure has been sent.
  bool marshalPaths(const PathVisitor& visitor);
  /// marshalPaths, then done() if every path was visited.
  bool processPaths(const PathVisitor& visitor);
  /// As marshalPaths, for the request's plug-in list. Does not reply on success.
  bool processUuidList(const PlugInVisitor& visitor);

  void done();
  void fail(std::uint64_t code, const std::string& message);
  /// An error of the system's own domain carries its own code; of another, `code` and its localized description.
  void fail(std::uint64_t code, const Error& error);

  const std::shared_ptr<XTDIpcClient>& client() const { return client_; }
  XTDServer& server() const;
  /// Null when it has gone.
  std::shared_ptr<platform::IpcConnection> connection() const;
  const platform::Value& request() const { return request_.body; }
  platform::Dictionary& reply() { return reply_.body; }
  std::uint64_t version() const { return version_; }

 private:
  explicit Transaction(platform::IpcMessage request, std::shared_ptr<XTDIpcClient> client);

  struct Handler {
    std::string_view type;
    void (Transaction::*call)();
  };
  static std::span<const Handler> handlers();

  // Handlers; each ends the transaction.
  void matchPlugIns();         // Transaction_Discovery.cpp
  void findPlugIn();           // Transaction_Find.cpp
  void annotatePlugIns();      // Transaction_Annotations.cpp
  void bulkAnnotatePlugIns();  // Transaction_Annotations.cpp
  void addPlugIns();           // Transaction_Registration.cpp
  void removePlugIns();        // Transaction_Registration.cpp
  void bulkPlugIns();          // Transaction_Registration.cpp
  void lockDownPlugIns();      // Transaction_Holds.cpp
  void readyPlugIns();         // Transaction_Activation.cpp
  void accessPlugIns();        // Transaction_Activation.cpp

  // Steps of handlers. What answers false has sent the failure.
  bool collectPlugInsToHold(std::uint64_t flags, std::vector<std::shared_ptr<XTDPlugIn>>& plugIns);
  bool noneIsBusy(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns);
  bool mayBeReady(const XTDPlugIn& plugIn);
  std::shared_ptr<XTDPlugIn> findPlugInByUUID(const platform::Value& uuid);
  std::shared_ptr<XTDPlugIn> findPlugInByPathURL(const platform::Value& text);
  /// The request's "paths" when they are a list of `count` elements, parallel to its UUIDs; else nothing (logged unless
  /// there are none).
  Value usablePaths(std::size_t count) const;
  /// What the daemon adds to an exported form before it is sent.
  void finishForm(const XTDPlugIn& plugIn, platform::Dictionary& form);
  /// Sets the form's "annotations" to what is stored for the plug-in, or to an empty dictionary.
  void addAnnotationForPlugIn(const XTDPlugIn& plugIn, platform::Dictionary& form);

  platform::IpcMessage request_;
  platform::IpcReply reply_;
  const std::shared_ptr<XTDIpcClient> client_;
  std::uint64_t version_ = 0;
  std::atomic<bool> answered_{false};
};

}  // namespace extora
