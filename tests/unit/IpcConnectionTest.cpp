#include "platform/ipc/IpcConnection.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <thread>

#include "platform/ipc/IpcCodec.h"
#include "platform/ipc/IpcFrame.h"
#include "platform/ipc/IpcMemoryFile.h"
#include "platform/ipc/IpcSocketConnection.h"
#include "tests/support/Eventually.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

using Type = IpcFrameType;
using Texts = std::vector<std::string>;

Bytes encoded(const Value& value) {
  Bytes out;
  encodeValue(value, out);
  return out;
}

// A frame with any header, sound or not.
Bytes frameOf(std::uint8_t type, std::uint64_t id, const Bytes& body, std::uint8_t flags = 0, std::uint16_t fds = 0) {
  IpcFrameHeader header;
  header.bodyLength = static_cast<std::uint32_t>(body.size());
  header.flags = flags;
  header.descriptorCount = fds;
  header.id = id;
  const auto head = header.serialize();
  Bytes frame(head.begin(), head.end());
  frame[4] = type;
  frame.insert(frame.end(), body.begin(), body.end());
  return frame;
}

Bytes request(std::uint64_t id, const Value& body) {
  return frameOf(1, id, encoded(body));
}

Bytes operator+(Bytes a, const Bytes& b) {
  a.insert(a.end(), b.begin(), b.end());
  return a;
}

// The raw end of a connection: bytes and descriptors as another program would send them.
class RawEnd {
 public:
  explicit RawEnd(UniqueFd socket) : socket_(std::move(socket)) {}

  void write(const Bytes& bytes, const std::vector<int>& descriptors = {}) const {
    struct iovec part = {const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    struct msghdr message = {};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    alignas(struct cmsghdr) std::array<char, CMSG_SPACE(4 * sizeof(int))> control{};
    if (!descriptors.empty()) {
      message.msg_control = control.data();
      message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
      struct cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header->cmsg_level = SOL_SOCKET;
      header->cmsg_type = SCM_RIGHTS;
      header->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
      std::memcpy(CMSG_DATA(header), descriptors.data(), descriptors.size() * sizeof(int));
    }
    EXPECT_EQ(::sendmsg(socket_.get(), &message, MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
  }

  struct Received {
    IpcFrameHeader header;
    Value body;  // nothing for the end of the connection
    UniqueFd memoryFile;
  };
  Received readFrame() const {
    Received received;
    std::array<std::uint8_t, IpcFrameHeader::kSize> head{};
    if (!readFully(head, &received.memoryFile)) return received;
    received.header = IpcFrameHeader::parse(head, nullptr).value();
    if (received.header.hasMemoryFile()) {
      IpcMemoryFileView view;
      std::string reason;
      EXPECT_TRUE(view.map(received.memoryFile.get(), received.header.bodyLength, &reason)) << reason;
      received.body = decodeValue(view.bytes(), nullptr);
    } else {
      Bytes body(received.header.bodyLength);
      if (readFully(body, nullptr)) received.body = decodeValue(body, nullptr);
    }
    return received;
  }
  bool atEnd() const {
    struct pollfd entry = {socket_.get(), POLLIN, 0};
    char byte = 0;
    return ::poll(&entry, 1, 10000) == 1 && ::recv(socket_.get(), &byte, 1, 0) <= 0;
  }
  int fd() const { return socket_.get(); }
  void close() { socket_.reset(); }

 private:
  bool readFully(std::span<std::uint8_t> to, UniqueFd* descriptor) const {
    while (!to.empty()) {
      struct pollfd entry = {socket_.get(), POLLIN, 0};
      if (::poll(&entry, 1, 10000) != 1) return false;
      struct iovec part = {to.data(), to.size()};
      alignas(struct cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
      struct msghdr message = {};
      message.msg_iov = &part;
      message.msg_iovlen = 1;
      message.msg_control = control.data();
      message.msg_controllen = control.size();
      const ssize_t size = ::recvmsg(socket_.get(), &message, MSG_CMSG_CLOEXEC);
      if (size <= 0) return false;
      if (const struct cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr && descriptor != nullptr) {
        int fd = -1;
        std::memcpy(&fd, CMSG_DATA(header), sizeof fd);
        descriptor->reset(fd);
      }
      to = to.subspan(static_cast<std::size_t>(size));
    }
    return true;
  }

  UniqueFd socket_;
};

std::pair<UniqueFd, UniqueFd> socketPair() {
  std::array<int, 2> ends = {-1, -1};
  EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
  return {UniqueFd(ends[0]), UniqueFd(ends[1])};
}

// A service's connection, and the raw end of its client. What the handler sees is recorded as text: the body of a
// message, or the kind and reason of an error.
class ServiceEnd {
 public:
  using OnMessage = std::function<void(ServiceEnd&, const IpcMessage&)>;

  explicit ServiceEnd(OnMessage onMessage = nullptr, IpcSocketConnection::Settings settings = {}) {
    auto [mine, others] = socketPair();
    client = std::make_unique<RawEnd>(std::move(others));
    const int on = 1;
    ::setsockopt(mine.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    settings.name = "test";
    settings.service = true;
    auto peer = PeerIdentity::ofSocket(mine.get());
    connection = IpcSocketConnection::make(std::move(mine), std::move(peer), settings);
    connection->setContext(context);
    connection->setEventHandler([this, onMessage = std::move(onMessage)](const IpcEvent& event) {
      if (const auto* message = std::get_if<IpcMessage>(&event)) {
        if (onMessage) onMessage(*this, *message);
        events.add(message->body.describe());
      } else {
        constexpr std::array kKinds = {"invalid", "terminating", "broken", "other"};
        const auto& error = std::get<IpcError>(event);
        events.add(fmt::format("{}: {}", kKinds.at(static_cast<std::size_t>(error.kind)), error.text));
      }
    });
    connection->resume();
  }
  ~ServiceEnd() {
    connection->cancel();
    EXPECT_TRUE(tests::eventually([this] { return connection->peerPid() == 0; }));
    EXPECT_TRUE(tests::eventually([this] { return context.use_count() == 1; })) << "the context is kept";
  }

  std::unique_ptr<RawEnd> client;
  std::shared_ptr<IpcSocketConnection> connection;
  std::shared_ptr<int> context = std::make_shared<int>(0);
  tests::Recorder<std::string> events;
};

void echo(ServiceEnd& service, const IpcMessage& message) {
  IpcReply reply = ipcCreateReply(message);
  reply.body.set("echo", message.body);
  service.connection->send(reply);
}

TEST(IpcConnectionTest, APeerWithoutFurtherRequestsGetsItsRepliesUnlessItGoes) {
  std::vector<IpcMessage> unserved;
  ServiceEnd service([&](ServiceEnd&, const IpcMessage& message) { unserved.push_back(message); });
  service.client->write(request(1, Dictionary{}) + request(2, Dictionary{}) + request(3, Dictionary{}));
  ::shutdown(service.client->fd(), SHUT_WR);
  ASSERT_EQ(service.events.waitFor(3).size(), 3U);
  for (const IpcMessage& message : unserved) {
    IpcReply reply = ipcCreateReply(message);
    reply.body.set("text", std::string(200'000, 'x'));  // only one of them is taken at once
    service.connection->send(reply);
  }
  EXPECT_EQ(service.events.waitFor(4).back(), "invalid: the peer has gone");
  for (const std::uint64_t id : {1U, 2U, 3U}) {
    const auto reply = service.client->readFrame();
    EXPECT_EQ(reply.header.id, id);
    EXPECT_EQ(reply.body["text"].string().size(), 200'000U);
  }
  EXPECT_TRUE(service.client->atEnd());

  unserved.clear();
  ServiceEnd waiting([&](ServiceEnd&, const IpcMessage& message) { unserved.push_back(message); });
  waiting.client->write(request(1, Dictionary{}));
  ::shutdown(waiting.client->fd(), SHUT_WR);
  ASSERT_EQ(waiting.events.waitFor(1).size(), 1U);
  waiting.client->close();
  EXPECT_EQ(waiting.events.waitFor(2).back(), "invalid: the peer has gone") << "though nobody has answered";
}

TEST(IpcConnectionTest, DescriptorsFromAClientAreClosedAtOnceAndBreakItsConnection) {
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
  const UniqueFd in(ends[0]);
  UniqueFd out(ends[1]);
  ServiceEnd service;
  service.client->write(request(1, Dictionary{}), {out.get(), out.get()});
  out.reset();
  EXPECT_TRUE(service.events.waitFor(1).at(0).starts_with("broken: "));
  char byte = 0;
  EXPECT_EQ(::read(in.get(), &byte, 1), 0);  // nobody holds the other end any more
}

TEST(IpcConnectionTest, ReadingPausesAt32UnservedRequests) {
  std::mutex mutex;
  std::vector<IpcMessage> unserved;
  std::size_t most = 0;
  ServiceEnd service([&](ServiceEnd&, const IpcMessage& message) {
    const std::lock_guard lock(mutex);
    unserved.push_back(message);
    most = std::max(most, unserved.size());
  });
  const auto serve = [&](bool withReply) {
    IpcMessage message;
    {
      const std::lock_guard lock(mutex);
      message = std::move(unserved.front());
      unserved.erase(unserved.begin());
    }
    if (withReply) service.connection->send(ipcCreateReply(message));
  };
  Bytes all;
  for (std::uint64_t id = 1; id <= 100; ++id) all = std::move(all) + request(id, Dictionary{});
  service.client->write(all);
  ASSERT_EQ(service.events.waitFor(32).size(), 32U);
  for (std::size_t served = 1; served <= 60; ++served) {
    serve(served % 2 == 0);  // a request that is let go without a reply counts as served
    ASSERT_EQ(service.events.waitFor(32 + served).size(), 32 + served);
  }
  EXPECT_EQ(most, 32U);
  // A pause does not keep the connection from being ended.
  service.connection->cancel();
  EXPECT_EQ(service.events.waitFor(93).back(), "invalid: the connection was cancelled");
}

TEST(IpcConnectionTest, ABacklogAboveItsBoundEndsTheConnection) {
  constexpr std::size_t kReply = 100'000;
  IpcSocketConnection::Settings settings;
  settings.maxBacklog = 1 << 20;
  ServiceEnd service(
      [](ServiceEnd& self, const IpcMessage& message) {
        IpcReply reply = ipcCreateReply(message);
        reply.body.set("text", std::string(kReply, 'x'));
        self.connection->send(reply);
      },
      settings);
  // Below the bound nothing is lost: the socket holds some, the backlog the rest.
  for (std::uint64_t id = 1; id <= 10; ++id) service.client->write(request(id, Dictionary{}));
  service.events.waitFor(10);
  for (std::uint64_t id = 1; id <= 10; ++id) {
    const auto reply = service.client->readFrame();
    EXPECT_EQ(reply.header.id, id);
    EXPECT_EQ(reply.body["text"].string().size(), kReply);
  }
  for (std::uint64_t id = 1; id <= 30; ++id) service.client->write(request(id, Dictionary{}));
  EXPECT_TRUE(tests::eventually(
      [&] { return service.events.now().back() == "invalid: more than 1048576 bytes wait to be sent"; }));
}

TEST(IpcConnectionTest, LargeRepliesTravelInSealedMemoryFilesOneUnreadAtATime) {
  ServiceEnd service([](ServiceEnd& self, const IpcMessage& message) {
    IpcReply reply = ipcCreateReply(message);
    reply.body.set("text", std::string(message.id == 3 ? 10 : 200'000, 'x'));
    self.connection->send(reply);
  });
  for (std::uint64_t id = 1; id <= 4; ++id) service.client->write(request(id, Dictionary{}));
  ASSERT_EQ(service.events.waitFor(4).size(), 4U);
  for (const std::uint64_t id : {1U, 2U, 3U, 4U}) {
    if (id == 1) {
      int unread = 0;
      ASSERT_EQ(::ioctl(service.client->fd(), FIONREAD, &unread), 0);
      EXPECT_EQ(static_cast<std::size_t>(unread), IpcFrameHeader::kSize);  // the first file, and nothing more
    }
    const auto reply = service.client->readFrame();
    EXPECT_EQ(reply.header.id, id);
    EXPECT_EQ(reply.header.hasMemoryFile(), id != 3);
    EXPECT_EQ(reply.body["text"].string().size(), id == 3 ? 10U : 200'000U);
    if (id == 3) continue;
    const int seals = ::fcntl(reply.memoryFile.get(), F_GET_SEALS);
    constexpr int kAll = F_SEAL_SEAL | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE;
    EXPECT_EQ(seals & kAll, kAll);
    EXPECT_NE(::fcntl(reply.memoryFile.get(), F_GETFD) & FD_CLOEXEC, 0);
  }
}

TEST(IpcConnectionTest, AReplyThatTheClientCouldNotTakeBecomesAnError) {
  IpcSocketConnection::Settings settings;
  settings.maxReplyBody = 1000;
  ServiceEnd service(echo, settings);
  service.client->write(request(1, Dictionary{{"text", std::string(2000, 'x')}}));
  EXPECT_EQ(service.client->readFrame().body, Value(Dictionary{{"error", "reply too large"}, {"errorcode", 4U}}));
}

TEST(IpcConnectionTest, UnfinishedBodiesOfAllConnectionsTogetherAreBounded) {
  IpcSocketConnection::Settings settings;
  settings.maxUnfinishedBytes = 100'000;
  ServiceEnd first(echo, settings);
  ServiceEnd second(echo, settings);
  const Bytes frame = request(1, Dictionary{{"text", std::string(80'000, 'x')}});
  const auto middle = frame.begin() + 60'000;
  first.client->write(Bytes(frame.begin(), middle));
  second.client->write(Bytes(frame.begin(), middle));
  ASSERT_TRUE(tests::eventually([&] { return !first.events.now().empty() || !second.events.now().empty(); }));
  const bool firstLost = second.events.now().empty();
  EXPECT_EQ((firstLost ? first : second).events.waitFor(1).at(0), "broken: unfinished bodies exceed 100000 bytes");
  // The other one, and those that come later, have their room.
  const ServiceEnd& other = firstLost ? second : first;
  other.client->write(Bytes(middle, frame.end()));
  EXPECT_EQ(other.client->readFrame().header.id, 1U);
  ServiceEnd third(echo, settings);
  third.client->write(frame);
  EXPECT_EQ(third.client->readFrame().header.id, 1U);
}

// A client's connection, and the raw end of its service.
class ClientEnd {
 public:
  ClientEnd() {
    auto [mine, others] = socketPair();
    service = std::make_unique<RawEnd>(std::move(others));
    connection = ipcConnectionOverSocket(std::move(mine), queue);
    connection->setEventHandler([this](const IpcEvent& event) { events.add(describe(event)); });
    connection->resume();
  }
  ~ClientEnd() {
    connection->cancel();
    EXPECT_TRUE(tests::eventually([this] { return connection->peerPid() == 0; }));
  }
  void reply(std::uint64_t id, const Value& body) const { service->write(frameOf(2, id, encoded(body))); }

  SerialQueue queue{"client"};
  std::unique_ptr<RawEnd> service;
  std::shared_ptr<IpcConnection> connection;
  tests::Recorder<std::string> events;
};

TEST(IpcConnectionTest, AClientMatchesRepliesInAnyOrderAndIgnoresUnknownOnes) {
  constexpr std::size_t kThreads = 6;
  ClientEnd client;
  tests::Recorder<std::string> replies;
  std::vector<std::thread> threads;
  for (std::size_t i = 0; i < kThreads; ++i) {
    threads.emplace_back([&, i] {
      const auto reply = client.connection->sendWithReplySync(Dictionary{{"n", i}});
      EXPECT_EQ(reply.body["n"], Value(i)) << reply.describe();
    });
  }
  client.connection->sendWithReply(Dictionary{{"n", kThreads}}, client.queue, [&](const IpcReplyObject& reply) {
    EXPECT_TRUE(client.queue.isCurrent());
    replies.add(reply.body["n"].describe());
  });
  client.connection->sendWithoutReply(Dictionary{{"n", kThreads + 1}});
  std::vector<std::pair<std::uint64_t, Value>> requests;
  for (std::size_t i = 0; i < kThreads + 2; ++i) {
    const auto received = client.service->readFrame();
    if (received.header.type == Type::Request) requests.emplace_back(received.header.id, received.body);
  }
  ASSERT_EQ(requests.size(), kThreads + 1);
  client.service->write(frameOf(2, 999, {0xc1}) + request(5, Dictionary{{"from", "service"}}));
  for (auto it = requests.rbegin(); it != requests.rend(); ++it) client.reply(it->first, it->second);
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(replies.waitFor(1), Texts{std::to_string(kThreads)});
  EXPECT_EQ(client.events.waitFor(1), Texts{Value(Dictionary{{"from", "service"}}).describe()});
  // After synchronous requests the end of the connection is still noticed by itself.
  client.service->close();
  EXPECT_EQ(client.events.waitFor(2).back(), "the peer has gone");
}

TEST(IpcConnectionTest, AClientTakesMemoryFilesOnlySealedAndOfTheirSize) {
  const Bytes body = encoded(Dictionary{{"text", "in a file"}});
  const auto ask = [&](const UniqueFd& file, std::size_t claimed, std::size_t passed) {
    ClientEnd client;
    std::thread service([&] {
      const auto received = client.service->readFrame();
      Bytes frame = frameOf(2, received.header.id, Bytes(claimed), kIpcFlagMemoryFile);
      frame.resize(IpcFrameHeader::kSize);
      client.service->write(frame, std::vector<int>(passed, file.get()));
    });
    const auto reply = client.connection->sendWithReplySync(Dictionary{});
    service.join();
    return reply.error ? reply.describe() : reply.body["text"].string();
  };
  const UniqueFd sealed = createSealedMemoryFile(body);
  const UniqueFd open(::memfd_create("open", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  ASSERT_EQ(::write(open.get(), body.data(), body.size()), static_cast<ssize_t>(body.size()));
  EXPECT_EQ(ask(sealed, body.size(), 1), "in a file");
  EXPECT_NE(ask(sealed, body.size() + 1, 1).find("bytes it claims"), std::string::npos);
  EXPECT_NE(ask(sealed, body.size(), 2).find("undeclared descriptors"), std::string::npos);
  EXPECT_NE(ask(sealed, body.size(), 0).find("descriptors are missing"), std::string::npos);
  EXPECT_NE(ask(open, body.size(), 1).find("not sealed"), std::string::npos);
  ASSERT_EQ(::fcntl(open.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW), 0);
  EXPECT_NE(ask(open, body.size(), 1).find("not sealed"), std::string::npos);
}

TEST(IpcConnectionTest, ARequestThatTheServiceWouldRefuseIsNotSent) {
  ClientEnd client;
  const auto bodyOf = [](std::size_t size) { return Dictionary{{"text", std::string(size, 'x')}}; };
  const auto tooLarge = client.connection->sendWithReplySync(bodyOf(kIpcMaxInlineBody));
  EXPECT_TRUE(tooLarge.describe().starts_with("request too large")) << tooLarge.describe();
  std::thread service([&] { client.reply(client.service->readFrame().header.id, Dictionary{}); });
  EXPECT_FALSE(client.connection->sendWithReplySync(bodyOf(kIpcMaxInlineBody - 100)).error);
  service.join();
}

}  // namespace
}  // namespace platform
