// Attempts on the daemon's trust: processes that try to wear the entitlements of somebody else. What they are after is
// a manager's sight of everything.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/sched.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <filesystem>

#include "Extora/XTProtocol.h"
#include "Extora/XTVocabulary.h"
#include "platform/ipc/IpcCodec.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/Daemon.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Bytes;
using platform::Dictionary;
using platform::UniqueFd;
using platform::Value;
using tests::Host;

const Dictionary kFind{{"request", "find"}, {"version", std::uint64_t{3}}};
const Dictionary kSeeAll{{"request", "match"}, {"version", std::uint64_t{3}}, {"flags", std::uint64_t{XTDiscoverAll}}};
constexpr const char* kRefused = "11 unauthorized discovery flag (XTDiscoverAll)";

bool sendAll(int fd, const Bytes& bytes) {
  return ::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

// The body of the next reply; nothing when the daemon has ended the connection.
Value receive(int fd) {
  std::array<std::uint8_t, platform::IpcFrameHeader::kSize> head{};
  if (::recv(fd, head.data(), head.size(), MSG_WAITALL) != static_cast<ssize_t>(head.size())) return {};
  const auto header = platform::IpcFrameHeader::parse(head, nullptr);
  if (!header) return {};
  Bytes body(header->bodyLength);
  if (::recv(fd, body.data(), body.size(), MSG_WAITALL) != static_cast<ssize_t>(body.size())) return {};
  return platform::decodeValue(body, nullptr);
}

class TrustTest : public ::testing::Test {
 protected:
  TrustTest() { daemon_.start(); }

  std::string writeManager(const std::string& name = "manager") const {
    return daemon_.writeHost(name, Dictionary{{XTManagerEntitlement, true}});
  }
  static std::string ask(Host& host) { return tests::failureOf(host.send(kSeeAll)); }
  std::string askFresh(const fs::path& executable, std::vector<std::string> before = {}) const {
    Host host(daemon_, executable, std::move(before));
    return ask(host);
  }
  // A socket that another process is to connect.
  static UniqueFd unconnected() {
    UniqueFd fd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const timeval limit{tests::kDeadline.count(), 0};
    ::setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    return fd;
  }

  tests::Daemon daemon_;
};

TEST_F(TrustTest, FilesThatOthersCouldHaveWrittenLendNothing) {
  const auto mode = [](unsigned bits) {
    return [bits](const fs::path& path) { fs::permissions(path, fs::perms(bits)); };
  };
  const auto link = [](const fs::path& path) {
    fs::rename(path, path.string() + ".real");
    fs::create_symlink(path.filename().string() + ".real", path);
  };
  const struct {
    const char* what;
    const char* path;  // in the application
    std::function<void(const fs::path&)> change;
  } cases[] = {
      {"world-writable entitlements", "Entitlements.plist", mode(0646)},
      {"world-writable executable", "host", mode(0757)},
      {"group-writable application", ".", mode(0775)},
      {"group-writable folder of applications", "..", mode(0775)},
      {"entitlements that are a link", "Entitlements.plist", link},
  };
  std::size_t lines = 0;
  for (const auto& each : cases) {
    SCOPED_TRACE(each.what);
    const fs::path manager = writeManager("manager" + std::to_string(++lines));
    EXPECT_EQ(askFresh(manager), "") << "as long as nothing is changed";
    each.change(manager.parent_path() / each.path);
    Host host(daemon_, manager);
    EXPECT_EQ(ask(host), kRefused);
    EXPECT_EQ(ask(host), kRefused);
    EXPECT_TRUE(
        daemon_.waitForLog("ERROR ops: error retrieving entitlements for client " + std::to_string(host.pid())));
    EXPECT_EQ(daemon_.countInLog("ERROR ops: error retrieving entitlements"), lines) << "once a client";
    fs::permissions(daemon_.applications(), fs::perms(0755));
  }
}

TEST_F(TrustTest, WhoeverRunsAFileThroughALinkIsThatFile) {
  const fs::path manager = writeManager();
  const fs::path elsewhere = daemon_.root() / "elsewhere";
  fs::create_symlink(manager, elsewhere);
  EXPECT_EQ(askFresh(elsewhere), "");
  fs::rename(manager, daemon_.root() / "moved");
  fs::create_symlink(daemon_.root() / "moved", manager);
  EXPECT_EQ(askFresh(manager), kRefused);
}

TEST_F(TrustTest, AnExecutableThatWasReplacedAfterConnectingLendsNothing) {
  const fs::path manager = writeManager();
  Host host(daemon_, manager);
  EXPECT_EQ(ask(host), "");
  fs::copy_file(manager, manager.string() + ".new");
  fs::rename(manager, manager.string() + ".old");
  fs::rename(manager.string() + ".new", manager);
  EXPECT_EQ(ask(host), kRefused);
  fs::remove(manager);
  EXPECT_EQ(ask(host), kRefused);
  fs::rename(manager.string() + ".old", manager);
  EXPECT_EQ(ask(host), "") << "the very file is back";
}

TEST_F(TrustTest, APrivateMountDoesNotPutAProgramUnderATrustedName) {
  const fs::path manager = writeManager();
  const fs::path own = daemon_.root() / "own";
  fs::create_directory(own);
  fs::copy_file(manager, own / "host");
  const auto behind = [](const std::string& scene) {
    return std::vector<std::string>{"/usr/bin/unshare", "-m", "/bin/sh", "-c", scene + "exec \"$0\" \"$@\""};
  };
  const std::string disguise = "mount --bind " + own.string() + " " + manager.parent_path().string() + " && ";
  if (tests::RunningProgram({"/usr/bin/unshare", "-m", "/bin/sh", "-c", disguise + "true"}, {}, STDERR_FILENO).wait() !=
      0) {
    GTEST_SKIP() << "no mount namespaces here";
  }
  EXPECT_EQ(askFresh(manager, behind("")), "") << "a namespace alone changes nothing";
  EXPECT_EQ(askFresh(manager, behind(disguise)), kRefused);
}

TEST_F(TrustTest, AHandedOverSocketIsWorthNothing) {
  const UniqueFd socket = unconnected();
  const Bytes find = tests::requestFrame(kFind);
  const tests::ChildProcess owner("",
                                  [&] { return daemon_.connectSocket(socket.get()) && sendAll(socket.get(), find); });
  ASSERT_TRUE(owner.running());
  EXPECT_EQ(tests::failureOf(receive(socket.get())), "15 Cannot locate PlugIn");
  ASSERT_TRUE(sendAll(socket.get(), find)) << "this is not the process that connected";
  EXPECT_TRUE(receive(socket.get()).isNothing());
  const std::string pid = std::to_string(owner.peer()->pid());
  EXPECT_TRUE(daemon_.waitForLog("ERROR ops: unexpected error type from ipc: bytes of process " +
                                 std::to_string(::getpid()) + " on the connection of process " + pid + "\n"));
  EXPECT_TRUE(daemon_.waitForLog("client " + pid + " is dead\n"));
}

// The daemon is stopped while a process ends that has asked, and while an entitled one gets its process id.
TEST_F(TrustTest, ARecycledProcessIdInheritsNothing) {
  if (!platform::PeerIdentity::kernelNamesPeers()) GTEST_SKIP() << "this kernel names peers by their number alone";
  const std::string manager = writeManager();
  const std::string runtime = daemon_.runtime();
  const Bytes find = tests::requestFrame(kFind);
  const Bytes seeAll = tests::requestFrame(kSeeAll);
  for (const bool accepted : {false, true}) {
    SCOPED_TRACE(accepted ? "after the connection was accepted" : "before the connection is accepted");
    const UniqueFd socket = unconnected();
    auto [mine, its] = tests::socketPair();
    const auto stop = [&] {
      daemon_.process().signal(SIGSTOP);
      int status = 0;
      ASSERT_EQ(::waitpid(daemon_.process().pid(), &status, WUNTRACED), daemon_.process().pid());
      ASSERT_TRUE(WIFSTOPPED(status));
    };
    if (!accepted) stop();
    const pid_t asking = ::fork();
    char byte = 0;
    if (asking == 0) {
      bool done = daemon_.connectSocket(socket.get()) && (!accepted || sendAll(socket.get(), find));
      done = ::write(its.get(), "x", 1) == 1 && done && ::read(its.get(), &byte, 1) == 1;
      ::_exit(done && sendAll(socket.get(), seeAll) ? 0 : 1);
    }
    ASSERT_EQ(::read(mine.get(), &byte, 1), 1);
    if (accepted) {
      EXPECT_EQ(tests::failureOf(receive(socket.get())), "15 Cannot locate PlugIn");
      stop();
    }
    ASSERT_EQ(::write(mine.get(), "x", 1), 1);
    int status = -1;
    ASSERT_EQ(::waitpid(asking, &status, 0), asking);
    ASSERT_EQ(status, 0);

    auto [orders, input] = tests::socketPair();
    tests::Client recycled(std::move(orders));
    struct clone_args arguments {};
    arguments.exit_signal = SIGCHLD;
    arguments.set_tid = reinterpret_cast<std::uint64_t>(&asking);
    arguments.set_tid_size = 1;
    const long made = ::syscall(SYS_clone3, &arguments, sizeof arguments);
    if (made == 0) {
      ::dup2(input.get(), STDIN_FILENO);
      ::execl(manager.c_str(), manager.c_str(), runtime.c_str(), tests::Daemon::kService, nullptr);
      ::_exit(127);
    }
    its.reset();
    EXPECT_EQ(::read(mine.get(), &byte, 1), 0) << "it has been executed";
    daemon_.process().signal(SIGCONT);
    if (made < 0) GTEST_SKIP() << "no process ids can be chosen here";
    EXPECT_EQ(made, asking);
    EXPECT_EQ(tests::failureOf(recycled.send(kSeeAll)), "") << "who has the number now may see everything";
    const Value reply = receive(socket.get());
    EXPECT_EQ(accepted ? tests::failureOf(reply) : reply.describe(), accepted ? kRefused : "(null)");
    ::kill(asking, SIGKILL);
    ::waitpid(asking, nullptr, 0);
  }
}

}  // namespace
}  // namespace extora
