#include "xtd/XTDServer.h"

#include <csignal>

#include "Extora/XTLog.h"
#include "xtd/XTDIpcClient.h"

namespace extora {
namespace {

platform::Mutex sharedMutex;
std::shared_ptr<XTDServer> sharedServer XT_GUARDED_BY(sharedMutex);

}  // namespace

std::shared_ptr<XTDServer> XTDServer::server() {
  const platform::MutexLock lock(sharedMutex);
  return sharedServer;
}

std::shared_ptr<XTDServer> XTDServer::initForService(std::shared_ptr<platform::Platform> platform,
                                                     const std::string& serviceName,
                                                     const std::optional<std::string>& databasePath) {
  std::shared_ptr<XTDServer> server(new XTDServer(std::move(platform)));
  if (!server->setupForService(serviceName, databasePath)) return nullptr;
  return server;
}

XTDServer::XTDServer(std::shared_ptr<platform::Platform> platform) : XTDatabase(std::move(platform)) {}

std::shared_ptr<XTDServer> XTDServer::self() {
  return std::static_pointer_cast<XTDServer>(shared_from_this());
}

bool XTDServer::setupForService(const std::string& serviceName, const std::optional<std::string>& databasePath) {
  if (!setupWithDatabase(databasePath)) return false;
  Error error;
  service_ = platform::ipcCreateListener(platformServices()->directories.runtime, serviceName, ipcQueue_, &error);
  if (service_ == nullptr) {
    XTLogOps().error("unable to create service {}: {}", serviceName, error);
    return false;
  }
  const auto self = this->self();
  {
    const platform::MutexLock lock(sharedMutex);
    sharedServer = self;
  }
  setDelegate(self);
  service_->setEventHandler([self](const platform::IpcEvent& event) { self->handleListenerEvent(event); });
  userPrefs_ = std::make_unique<XTDUserPrefs>(platformServices()->preferences);
  sigSource_ = platform::MainRunLoop::main().addSignal(SIGTERM, [weak = std::weak_ptr<XTDServer>(self)] {
    if (const auto server = weak.lock()) server->stop();
    platform::MainRunLoop::exitProcess(0);
  });
  return true;
}

void XTDServer::handleListenerEvent(const platform::IpcEvent& event) {
  if (const auto* connection = std::get_if<std::shared_ptr<platform::IpcConnection>>(&event)) {
    if (XTDIpcClient::initWithConnection(*connection, self()) == nullptr) (*connection)->cancel();
    return;
  }
  const auto* error = std::get_if<platform::IpcError>(&event);
  if (error == nullptr) {
    XTLogOps().error("unexpected message: {}", platform::describe(event));
  } else if (error->kind == platform::IpcError::Kind::ConnectionInvalid) {
    XTLogOps().def("potentially unexpected error from ipc: {}", *error);
  } else {
    XTLogOps().error("unexpected error from ipc: {}", *error);
  }
}

void XTDServer::resume() {
  service_->resume();
}

void XTDServer::run() {
  resume();
  platform::MainRunLoop::main().run();
}

void XTDServer::submitWork(std::function<void()> work, bool synchronously) {
  if (!synchronously) {
    mainQueue_.async(std::move(work));
    return;
  }
  XTLogOps().debug("submitting block to main queue synchronously");
  mainQueue_.sync(work);
}

void XTDServer::stop() {
  service_->cancel();
  syncQueue_.sync([&] {
    syncQueue_.assertOnQueue();
    for (const auto& hold : holds_) {
      XTLogOps().debug("releasing plug-in hold {} because server is stopping", hold->uuid());
    }
    holds_.clear();
    notifyAnnotationChange();
  });
}

}  // namespace extora
