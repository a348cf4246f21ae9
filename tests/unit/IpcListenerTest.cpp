#include "platform/ipc/IpcListener.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <utility>

#include "platform/ipc/IpcServiceAddress.h"
#include "tests/support/Eventually.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr const char* kService = "com.example.service";

class IpcListenerTest : public testing::Test {
 protected:
  IpcListenerTest() {
    std::string pattern = (fs::temp_directory_path() / "ipc-listener-XXXXXX").string();
    runtime_ = ::mkdtemp(pattern.data());
  }
  ~IpcListenerTest() override {
    if (listener_) listener_->cancel();
    queue_.sync([] {});
    fs::remove_all(runtime_);
  }

  // Serves; each connection echoes what it is asked.
  bool serve() {
    listener_ = ipcCreateListener(runtime_, kService, queue_, &error_);
    if (!listener_) return false;
    listener_->setEventHandler([this](const IpcEvent& event) {
      EXPECT_TRUE(queue_.isCurrent());
      if (const auto* connection = std::get_if<std::shared_ptr<IpcConnection>>(&event)) {
        const std::weak_ptr<IpcConnection> weak = *connection;
        (*connection)->setEventHandler([weak](const IpcEvent& inner) {
          const auto* message = std::get_if<IpcMessage>(&inner);
          if (message == nullptr) return;
          IpcReply reply = ipcCreateReply(*message);
          reply.body.set("echo", message->body);
          if (const auto self = weak.lock()) self->send(reply);
        });
        accepted_.add(*connection);
        (*connection)->resume();
      } else {
        errors_.add(std::get<IpcError>(event).text);
      }
    });
    listener_->resume();
    return true;
  }
  // What an own client gets back: "ok", or the error.
  std::string ask(const std::string& runtime) {
    const auto client = ipcConnectService(runtime, kService, queue_);
    client->resume();
    const Value body = Dictionary{{"request", "find"}};
    const auto reply = client->sendWithReplySync(body);
    return reply.body["echo"] == body ? "ok" : reply.describe();
  }
  // A raw client, for use in a child process too.
  UniqueFd connectRaw() const {
    const auto address = IpcServiceAddress::make(ipcServicesDirectory(runtime_), kService, nullptr);
    UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!address || ::connect(socket.get(), address->address(), address->size()) != 0) return {};
    return socket;
  }
  fs::path socketPath() const { return fs::path(runtime_) / "services" / kService; }

  std::string runtime_;
  const SerialQueue queue_{"ipc"};
  Error error_;
  tests::Recorder<std::shared_ptr<IpcConnection>> accepted_;
  tests::Recorder<std::string> errors_;
  std::shared_ptr<IpcListener> listener_;
};

TEST_F(IpcListenerTest, AStaleSocketIsReplacedAndNothingElseIs) {
  fs::create_directories(socketPath().parent_path());
  {
    const UniqueFd stale(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto address = IpcServiceAddress::make(ipcServicesDirectory(runtime_), kService, nullptr);
    ASSERT_EQ(::bind(stale.get(), address->address(), address->size()), 0);
  }
  ASSERT_TRUE(serve()) << error_.describe();
  EXPECT_EQ(ask(runtime_), "ok");
  listener_->cancel();
  std::ofstream(socketPath()) << "mine";
  EXPECT_FALSE(serve());
  EXPECT_NE(error_.describe().find("is no socket"), std::string::npos) << error_.describe();
  EXPECT_TRUE(fs::is_regular_file(socketPath()));
  // A socket that somebody has put in the place of the listener's is not the listener's to remove.
  fs::remove(socketPath());
  ASSERT_TRUE(serve()) << error_.describe();
  fs::rename(socketPath(), socketPath().string() + ".moved");
  std::ofstream(socketPath()) << "mine";
  listener_->cancel();
  EXPECT_TRUE(fs::exists(socketPath()));
}

TEST_F(IpcListenerTest, PathsTooLongForASocketAddressAndWrongNames) {
  const std::string outer = runtime_;
  runtime_ += "/" + std::string(120, 'd');
  ASSERT_TRUE(serve()) << error_.describe();
  EXPECT_EQ(ask(runtime_), "ok");
  EXPECT_TRUE(fs::is_socket(socketPath()));
  for (const char* name : {"", ".hidden", "a/b", "..", "-dash", "sp ace"}) {
    EXPECT_EQ(ipcCreateListener(runtime_, name, queue_, &error_), nullptr) << name;
  }
  EXPECT_EQ(ipcCreateListener(runtime_, std::string(129, 'a'), queue_, &error_), nullptr);
  EXPECT_NE(ask(outer).find("cannot connect to " + outer), std::string::npos);
  listener_->cancel();
  EXPECT_FALSE(fs::exists(socketPath()));
  runtime_ = outer;
}

TEST_F(IpcListenerTest, ActivationSocketsAreUsedAndStay) {
  // The activated service is this test again, in a process of its own.
  if (const char* runtime = std::getenv("TEST_ACTIVATED_RUNTIME")) {
    const std::string own = std::exchange(runtime_, runtime);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    ASSERT_TRUE(serve()) << error_.describe();
    EXPECT_EQ(ask(runtime_), "ok");
    EXPECT_EQ(accepted_.now().size(), 2U);  // with the one that came before
    listener_->cancel();
    EXPECT_TRUE(fs::is_socket(socketPath()));
    runtime_ = own;
    return;
  }
  fs::create_directories(socketPath().parent_path());
  const UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const auto address = IpcServiceAddress::make(ipcServicesDirectory(runtime_), kService, nullptr);
  ASSERT_EQ(::bind(socket.get(), address->address(), address->size()), 0);
  ASSERT_EQ(::listen(socket.get(), 8), 0);
  const UniqueFd early = connectRaw();
  ASSERT_TRUE(early);
  const pid_t child = ::fork();
  if (child == 0) {
    ::setenv("LISTEN_FDS", "2", 1);
    ::setenv("LISTEN_FDNAMES", (std::string("com.example.else:") + kService).c_str(), 1);
    ::setenv("TEST_ACTIVATED_RUNTIME", runtime_.c_str(), 1);
    const int copy = ::fcntl(socket.get(), F_DUPFD, 10);
    ::dup2(STDERR_FILENO, 3);
    ::dup2(copy, 4);
    ::execl("/proc/self/exe", "test", "--gtest_filter=IpcListenerTest.ActivationSocketsAreUsedAndStay", nullptr);
    ::_exit(127);
  }
  int status = -1;
  ::waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
}

TEST_F(IpcListenerTest, WhenDescriptorsRunOutAcceptingWaitsAndGoesOn) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizers look at memory through a pipe, for which no descriptor is left here";
#endif
  tests::LogCapture log;
  ASSERT_TRUE(serve()) << error_.describe();
  const UniqueFd lowestFree(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  const UniqueFd client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct rlimit before = {};
  ::getrlimit(RLIMIT_NOFILE, &before);
  const struct rlimit none = {static_cast<rlim_t>(client.get()) + 1, before.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
  const auto address = IpcServiceAddress::make(ipcServicesDirectory(runtime_), kService, nullptr);
  EXPECT_EQ(::connect(client.get(), address->address(), address->size()), 0);
  std::vector<std::string> lines;
  EXPECT_TRUE(tests::eventually([&] {
    for (auto& line : log.take()) lines.push_back(std::move(line));
    return !lines.empty();
  }));
  ::setrlimit(RLIMIT_NOFILE, &before);
  EXPECT_EQ(accepted_.waitFor(1).size(), 1U);
  for (auto& line : log.take()) lines.push_back(std::move(line));
  EXPECT_EQ(lines,
            (std::vector<std::string>{"ERROR -: cannot accept connections to com.example.service for now: Too many "
                                      "open files"}));
}

}  // namespace
}  // namespace platform
