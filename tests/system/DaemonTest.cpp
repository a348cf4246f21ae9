// The daemon as a process: its command line, its life and its end, and what broken or dying clients do to it.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>

#include <fstream>

#include "Extora/XTVocabulary.h"
#include "platform/ipc/IpcFrame.h"
#include "tests/support/Daemon.h"

namespace extora {
namespace {

using platform::Bytes;
using platform::Dictionary;
using platform::IpcFrameHeader;
using platform::Value;
using tests::Daemon;
using tests::failureOf;
using tests::frame;
using tests::requestFrame;

const Dictionary kFind = {{"request", "find"}, {"version", std::uint64_t{3}}};

// Served before anything that follows it on its connection is looked at, the end included.
const Dictionary kSyncFind = {{"request", "find"}, {"version", std::uint64_t{3}}, {"sync", true}};

void sendAll(const platform::UniqueFd& fd, const Bytes& bytes) {
  // The daemon may have ended the connection before all is written.
  (void)::send(fd.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
}

// What the daemon sends until it ends the connection; fails the test when it does not.
Bytes receiveToEnd(const platform::UniqueFd& fd) {
  Bytes bytes;
  std::uint8_t buffer[4096];
  for (ssize_t got = 0; (got = ::recv(fd.get(), buffer, sizeof buffer, 0)) != 0;) {
    if (got < 0) {
      EXPECT_EQ(errno, ECONNRESET) << "the daemon keeps the connection";
      break;
    }
    bytes.insert(bytes.end(), buffer, buffer + got);
  }
  return bytes;
}

class DaemonTest : public ::testing::Test {
 protected:
  Daemon daemon_;
};

TEST_F(DaemonTest, CommandLineErrorsEndItBeforeAServerIsBuilt) {
  for (const std::vector<std::string>& arguments :
       {std::vector<std::string>{"operand"}, {"-x"}, {"-S"}, {"-v", "--", "-v"}}) {
    EXPECT_EQ(daemon_.run(arguments), 2);
    EXPECT_EQ(daemon_.countInLog("Usage: xtd [-S servicename] [-v]\n"), 1U);
    EXPECT_EQ(daemon_.countInLog("INFO ops: xtd is launching"), 1U);
  }
  EXPECT_FALSE(std::filesystem::exists(daemon_.state()));
  EXPECT_FALSE(std::filesystem::exists(daemon_.runtime()));
}

TEST_F(DaemonTest, OptionsChangeNameLimitAndDatabase) {
  const auto database = daemon_.root() / "annotations.plist";
  daemon_.start({"-v", "-c", "abc", "-v", "-S", "com.example.other", "-d", database});
  EXPECT_EQ(
      daemon_.countInLog("ERROR -: verbose option -v is ineffective; use log config --subsystem com.orvane.extora\n"),
      2U);
  EXPECT_EQ(failureOf(daemon_.connect("com.example.other").send(kFind)), "15 Cannot locate PlugIn");
  EXPECT_FALSE(std::filesystem::exists(daemon_.socket()));
  EXPECT_EQ(daemon_.stop(), 0);
}

TEST_F(DaemonTest, AServerThatCannotBeBuiltIsAnError) {
  EXPECT_EQ(daemon_.run({"-S", "bad/name"}), 1);
  EXPECT_EQ(daemon_.countInLog("ERROR ops: unable to construct server\n"), 1U);
  EXPECT_GE(daemon_.countInLog("ERROR ops: "), 2U) << "the reason is missing";

  daemon_.start();
  Daemon second;
  second.setEnvironment("EXTORA_STATE_DIR", daemon_.state());
  EXPECT_EQ(second.run({}), 1) << "one daemon a state directory";
  Daemon third;
  third.setEnvironment("EXTORA_RUNTIME_DIR", daemon_.runtime());
  EXPECT_EQ(third.run({}), 1) << "one daemon a service";
  EXPECT_EQ(failureOf(daemon_.connect().send(kFind)), "15 Cannot locate PlugIn");
}

TEST_F(DaemonTest, RefusesWhatItDoesNotServe) {
  daemon_.start();
  auto client = daemon_.connect();
  for (const Value& version : {Value(), Value(1U), Value(4U), Value(3), Value(std::uint64_t{1} << 32), Value("3")}) {
    EXPECT_EQ(failureOf(client.send({{"request", "find"}, {"version", version}})),
              "7 unsupported protocol version " + std::to_string(version.exactUnsigned()) + " (current 3)");
  }
  const Value two = 2U;
  EXPECT_EQ(failureOf(client.send({{"version", two}})), "4 invalid request format (missing type)");
  EXPECT_EQ(failureOf(client.send({{"version", two}, {"request", 7U}})), "4 invalid request format (missing type)");
  EXPECT_EQ(failureOf(client.send({{"version", two}, {"request", "find"}})), "15 Cannot locate PlugIn");
  EXPECT_TRUE(client.send({{"version", two}, {"request", "match"}}) == Value(Dictionary())) << "no encoding for forms";
  for (const char* type : {"Match", "match ", ""}) EXPECT_EQ(failureOf(client.request(type)), "4 unrecognized request");
  EXPECT_EQ(failureOf(client.request("match", {{"rules", "x"}})), "4 invalid request format (bad rules dictionary)");
}

TEST_F(DaemonTest, ASynchronousRequestIsAnsweredAfterAllEarlierOnes) {
  daemon_.start();
  auto client = daemon_.connect();
  constexpr int kEarlier = 1998;
  int answered = 0;
  for (int i = 0; i < kEarlier; ++i) {
    client.connection().sendWithReply(kFind, client.queue(), [&](const auto& reply) {
      EXPECT_EQ(failureOf(reply.body), "15 Cannot locate PlugIn");
      ++answered;
    });
  }
  EXPECT_EQ(failureOf(client.request("find", {{"sync", true}})), "15 Cannot locate PlugIn");
  client.queue().sync([&] { EXPECT_EQ(answered, kEarlier); });
  EXPECT_EQ(daemon_.countInLog("DEBUG ops: submitting block to main queue synchronously\n"), 1U);
  EXPECT_EQ(daemon_.countInLog(" requests so far\n"), 1U) << "of 1,999 requests";
}

TEST_F(DaemonTest, SigtermIsAnOrderlyStop) {
  daemon_.start();
  const auto client = daemon_.connect();
  const auto before = daemon_.notificationCount(std::string(XTNotifyAnnotationChange));
  EXPECT_EQ(daemon_.stop(), 0);
  EXPECT_EQ(daemon_.notificationCount(std::string(XTNotifyAnnotationChange)), before + 1);
  EXPECT_FALSE(std::filesystem::exists(daemon_.socket()));
}

TEST_F(DaemonTest, ACrashedDaemonIsReplaced) {
  daemon_.start();
  daemon_.process().signal(SIGKILL);
  EXPECT_EQ(daemon_.process().wait(), 128 + SIGKILL);
  EXPECT_TRUE(std::filesystem::exists(daemon_.socket())) << "the test means a socket that was left behind";
  daemon_.start();
  EXPECT_EQ(failureOf(daemon_.connect().send(kFind)), "15 Cannot locate PlugIn");
}

TEST_F(DaemonTest, AClientMayDieAtAnyStage) {
  daemon_.start();
  auto bystander = daemon_.connect();
  const Bytes request = requestFrame(kFind);
  const Bytes dying = frame({.type = platform::IpcFrameType::TerminationImminent}, {});
  Bytes several;
  for (int i = 0; i < 50; ++i) several.insert(several.end(), request.begin(), request.end());
  const Bytes stages[] = {{},
                          {request.begin(), request.begin() + 5},
                          {request.begin(), request.begin() + 16},
                          {request.begin(), request.end() - 1},
                          request,
                          several,
                          dying};
  std::size_t dead = 0;
  for (const Bytes& stage : stages) {
    {
      const auto fd = daemon_.connectRaw();
      sendAll(fd, stage);
    }
    EXPECT_TRUE(daemon_.waitForLog(" is dead\n", ++dead));
    EXPECT_EQ(failureOf(bystander.send(kFind)), "15 Cannot locate PlugIn");
  }
  EXPECT_EQ(daemon_.countInLog(" termination imminent\n"), 1U);

  // One that has said all it had to say is answered.
  const auto fd = daemon_.connectRaw();
  sendAll(fd, several);
  ::shutdown(fd.get(), SHUT_WR);
  const Bytes answers = receiveToEnd(fd);
  EXPECT_EQ(tests::countOf({reinterpret_cast<const char*>(answers.data()), answers.size()}, "Cannot locate PlugIn"),
            50U);
}

TEST_F(DaemonTest, BrokenInputEndsItsOwnConnectionAlone) {
  daemon_.start();
  auto bystander = daemon_.connect();
  const Bytes map = {0x80};
  std::vector<std::pair<std::string, Bytes>> broken;
  for (const int type : {0, 2, 5, 255}) {
    broken.emplace_back("type " + std::to_string(type),
                        frame({.type = static_cast<platform::IpcFrameType>(type)}, map));
  }
  broken.emplace_back("unknown flag", frame({.flags = 0x02}, map));
  broken.emplace_back("memory file flag", frame({.flags = platform::kIpcFlagMemoryFile}, map));
  broken.emplace_back("descriptor that did not come", frame({.descriptorCount = 1}, map));
  broken.emplace_back("termination with a body", frame({.type = platform::IpcFrameType::TerminationImminent}, map));
  auto oversized = frame({}, map);
  oversized[3] = 0x7f;
  broken.emplace_back("oversized length", oversized);

  std::ifstream vectors(EXTORA_TEST_DATA "/wire-vectors.txt");
  std::string line;
  while (std::getline(vectors, line) && !line.starts_with("# malformed bodies")) {
  }
  while (std::getline(vectors, line)) {
    const auto bar = line.find(" | ");
    if (bar == std::string::npos) continue;
    Bytes body;
    for (auto at = bar + 3; at + 1 < line.size(); at += 2) {
      body.push_back(static_cast<std::uint8_t>(std::stoi(line.substr(at, 2), nullptr, 16)));
    }
    broken.emplace_back(line.substr(0, bar), frame({.id = 1}, body));
  }
  ASSERT_GT(broken.size(), 20U) << "wire-vectors.txt has been changed";

  for (const auto& [name, bytes] : broken) {
    SCOPED_TRACE(name);
    const auto fd = daemon_.connectRaw();
    sendAll(fd, bytes);
    EXPECT_EQ(receiveToEnd(fd).size(), 0U) << "an answer to broken input";
    EXPECT_EQ(failureOf(bystander.send(kFind)), "15 Cannot locate PlugIn");
  }
  EXPECT_TRUE(daemon_.waitForLog(" is dead\n", broken.size()));
  EXPECT_EQ(daemon_.countInLog("ERROR ops: unexpected error type from ipc: "), broken.size());
  EXPECT_EQ(daemon_.stop(), 0);
}

TEST_F(DaemonTest, ABodyThatIsNoDictionaryIsLoggedAndNotAnswered) {
  daemon_.start();
  const auto fd = daemon_.connectRaw();
  sendAll(fd, requestFrame(platform::Array{"find"}));
  sendAll(fd, requestFrame(kSyncFind));
  ::shutdown(fd.get(), SHUT_WR);
  const Bytes answer = receiveToEnd(fd);
  ASSERT_GT(answer.size(), IpcFrameHeader::kSize);
  EXPECT_EQ(answer.size(), IpcFrameHeader::kSize + answer[0]) << "more than one reply";
  EXPECT_TRUE(daemon_.waitForLog("ERROR ops: unexpected message: "));
}

}  // namespace
}  // namespace extora
