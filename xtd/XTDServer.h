// XTDServer: the one server object: the database, extended with connections, queues, holds and termination.
//
// Queues: "ipc" takes listener events; "service" (mainQueue) runs every request, one at a time, in submission order;
// "serverSync" guards the holds. Code on "serverSync" enters no other queue.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ipc/IpcListener.h"
#include "platform/queue/MainRunLoop.h"
#include "xtd/XTDPlugInHold.h"
#include "xtd/XTDUserPrefs.h"
#include "xtd/XTDatabase.h"

namespace extora {

class XTDServer : public XTDatabase, public XTDatabaseDelegate {
 public:
  /// The process-wide server; null before the first construction.
  static std::shared_ptr<XTDServer> server();
  /// Null when the database side or the listener cannot be made (logged). Does not start listening.
  static std::shared_ptr<XTDServer> initForService(std::shared_ptr<platform::Platform> platform,
                                                   const std::string& serviceName,
                                                   const std::optional<std::string>& databasePath);

  /// Starts the listener and runs the main thread's run loop.
  void run();
  /// Starts the listener only (run without the loop), for programs that run the loop themselves.
  void resume();
  /// Runs `work` on the service queue; with `synchronously` the caller waits until it has run.
  void submitWork(std::function<void()> work, bool synchronously);
  /// Cancels the listener, releases every hold, posts one notification.
  void stop();
  void removedPlugIns(const platform::PlugInRecords& records) override;

  /// Ends the running instances of `records` (XTDServer_Termination.cpp); returns at once. `reply` is called on a queue
  /// of the termination once the job manager has answered for each, whatever the answers are.
  void terminatePlugIns(const platform::PlugInRecords& records, std::function<void()> reply);

  // Holds (XTDServer_Holds.cpp).
  bool holdOnPlugIn(const XTDPlugIn& plugIn);
  void addHold(std::shared_ptr<XTDPlugInHold> hold);
  void unholdToken(const Uuid& token);
  void unholdClient(const XTDIpcClient& client);

  std::uint32_t verbose() const { return verbose_.load(); }
  void setVerbose(std::uint32_t count) { verbose_.store(count); }
  const platform::SerialQueue& ipcQueue() const { return ipcQueue_; }
  const platform::SerialQueue& mainQueue() const XT_RETURN_CAPABILITY(mainQueue_) { return mainQueue_; }
  const platform::SerialQueue& syncQueue() const XT_RETURN_CAPABILITY(syncQueue_) { return syncQueue_; }
  XTDUserPrefs& userPrefs() { return *userPrefs_; }

 private:
  explicit XTDServer(std::shared_ptr<platform::Platform> platform);
  [[nodiscard]] bool setupForService(const std::string& serviceName, const std::optional<std::string>& databasePath);
  void handleListenerEvent(const platform::IpcEvent& event);
  std::shared_ptr<XTDServer> self();

  std::atomic<std::uint32_t> verbose_{0};
  platform::SerialQueue ipcQueue_{"ipc"};
  platform::SerialQueue mainQueue_{"service"};
  platform::SerialQueue syncQueue_{"serverSync"};
  // Constant after construction.
  std::shared_ptr<platform::IpcListener> service_;
  std::unique_ptr<XTDUserPrefs> userPrefs_;
  std::unique_ptr<platform::MainRunLoop::Source> sigSource_;
  std::vector<std::shared_ptr<XTDPlugInHold>> holds_ XT_GUARDED_BY(syncQueue_);  // oldest first
};

}  // namespace extora
