#include "Extora/XTDaemonClient.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <future>
#include <thread>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/ipc/IpcFrame.h"
#include "platform/value/InternalInconsistency.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

using platform::Array;
using platform::Bytes;
using platform::Dictionary;
using platform::IpcError;
using platform::IpcFrameHeader;
using platform::IpcFrameType;
using platform::IpcReplyObject;
using platform::Url;
using platform::Uuid;
using platform::Value;

constexpr std::chrono::seconds kDeadline{20};
const Uuid kUuid = *Uuid::parse("8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8");
const Uuid kOther = *Uuid::parse("00000000-0000-4000-8000-000000000001");

// The daemon's end of a connection, read and written as plain bytes.
class Peer {
 public:
  explicit Peer(int fd) : fd_(fd) {
    const timeval deadline{kDeadline.count(), 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &deadline, sizeof deadline);
  }

  struct Request {
    IpcFrameHeader header;
    Bytes body;
  };
  Request read() {
    std::array<std::uint8_t, IpcFrameHeader::kSize> bytes{};
    EXPECT_EQ(::recv(fd_.get(), bytes.data(), bytes.size(), MSG_WAITALL), static_cast<ssize_t>(bytes.size()));
    const auto header = IpcFrameHeader::parse(bytes, nullptr);
    if (!header) return {};
    Request request{*header, Bytes(header->bodyLength)};
    EXPECT_EQ(::recv(fd_.get(), request.body.data(), request.body.size(), MSG_WAITALL),
              static_cast<ssize_t>(request.body.size()));
    return request;
  }
  void reply(std::uint64_t id, const Dictionary& body) {
    Bytes bytes(IpcFrameHeader::kSize);
    platform::encodeValue(body, bytes);
    IpcFrameHeader header;
    header.type = IpcFrameType::Reply;
    header.id = id;
    header.bodyLength = static_cast<std::uint32_t>(bytes.size() - IpcFrameHeader::kSize);
    const auto head = header.serialize();
    std::copy(head.begin(), head.end(), bytes.begin());
    EXPECT_EQ(::send(fd_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
  }

 private:
  platform::UniqueFd fd_;
};

Bytes encoded(const Dictionary& body) {
  Bytes bytes;
  platform::encodeValue(body, bytes);
  return bytes;
}

class XTDaemonClientTest : public testing::Test {
 protected:
  XTDaemonClientTest() {
    int sockets[2];
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sockets), 0);
    peer_ = std::make_unique<Peer>(sockets[0]);
    queue_ = client_->replyQueue();
    connection_ = platform::ipcConnectionOverSocket(platform::UniqueFd(sockets[1]), *queue_);
    connection_->setEventHandler([](const platform::IpcEvent&) {});
    connection_->resume();
    client_->setXtd(connection_);
  }
  ~XTDaemonClientTest() override { connection_->cancel(); }

  // A reply function and what it was given.
  XTDaemonClient::Reply keep() {
    auto promise = std::make_shared<std::promise<IpcReplyObject>>();
    replied_ = promise->get_future();
    return [this, promise](const IpcReplyObject& reply) {
      onQueue_ = queue_->isCurrent();
      replyThread_ = std::this_thread::get_id();
      promise->set_value(reply);
    };
  }
  IpcReplyObject kept() {
    EXPECT_EQ(replied_.wait_for(kDeadline), std::future_status::ready);
    return replied_.get();
  }
  // Answers one request with an empty reply, from a thread of its own so that a synchronous one can wait for it.
  std::future<Peer::Request> serveOne() {
    return std::async(std::launch::async, [this] {
      Peer::Request request = peer_->read();
      peer_->reply(request.header.id, {});
      return request;
    });
  }

  std::shared_ptr<XTDaemonClient> client_ = XTDaemonClient::initWithServiceName("com.example.nobody");
  std::shared_ptr<platform::SerialQueue> queue_;
  std::shared_ptr<platform::IpcConnection> connection_;
  std::unique_ptr<Peer> peer_;
  std::future<IpcReplyObject> replied_;
  bool onQueue_ = false;
  std::thread::id replyThread_;
};

TEST_F(XTDaemonClientTest, RequestsAsTheyAreBuiltAndSent) {
  const XTDaemonClient::PlugIns plugIns = {{"/b", kUuid}, {"/a", kOther}};
  const std::vector<std::string> paths = {"/b", "/a"};
  const Dictionary rules = {{"HXExtensionProtocol", "P"}};
  const Dictionary environment = {{"A", "b"}};
  const Value uuidArray = Array{kUuid, kOther};
  const Value pathArray = Array{"/b", "/a"};
  using Reply = XTDaemonClient::Reply;
  struct Case {
    std::function<void(const Reply&)> send;
    const char* type;
    Dictionary keys;
  };
  const std::vector<Case> cases = {
      {[&](const Reply& r) { client_->addPlugIns(paths, r); }, "add", {{"paths", pathArray}}},
      {[&](const Reply& r) { client_->removePlugIns({}, r); }, "remove", {{"paths", Array{}}}},
      {[&](const Reply& r) { client_->bulkPlugins(7, r); }, "bulk", {{"flags", 7U}}},
      {[&](const Reply& r) { client_->readyPlugIns(plugIns, false, 1, {}, r); },
       "ready",
       {{"flags", 1U}, {"uuids", uuidArray}, {"paths", pathArray}}},
      {[&](const Reply& r) { client_->readyPlugIns(plugIns, true, 0, environment, r); },
       "ready",
       {{"flags", 0U}, {"uuids", uuidArray}, {"paths", pathArray}, {"environment", environment}, {"sync", true}}},
      {[&](const Reply& r) { client_->accessPlugIns(plugIns, true, 2, r); },
       "access",
       {{"flags", 2U}, {"uuids", uuidArray}, {"paths", pathArray}, {"sync", true}}},
      {[&](const Reply& r) { client_->findPlugInByUUID(kUuid, r); }, "find", {{"uuids", kUuid}}},
      {[&](const Reply& r) { client_->findPlugInByPathURL(Url::file("/My App.app"), r); },
       "find",
       {{"paths", "file:///My%20App.app"}}},
      {[&](const Reply& r) { client_->matchPlugIns(rules, 1024, r); },
       "match",
       {{"rules", rules}, {"flags", 1024U}, {"sync", true}}},
      {[&](const Reply& r) { client_->matchPlugIns({}, 1023, r); },
       "match",
       {{"rules", Dictionary{}}, {"flags", 1023U}}},
      {[&](const Reply& r) {
         client_->setPluginAnnotations({kUuid, kOther}, Dictionary{{"election", 1}}, r);
       },
       "annotate",
       {{"uuids", uuidArray}, {"annotations", Dictionary{{"election", 1}}}}},
      // What the wire between host and daemon does not carry is left out.
      {[&](const Reply& r) {
         const Value message = Value::message({0x01});
         client_->bulkSetPluginAnnotations(Dictionary{{"a", Array{1, message, 2}}, {"b", message}}, r);
       },
       "bulk-annotate",
       {{"annotations", Dictionary{{"a", Array{1, 2}}}}}},
      {[&](const Reply& r) { client_->holdPlugins(paths, 5, r); }, "lock", {{"paths", pathArray}, {"flags", 5U}}},
      {[&](const Reply& r) { client_->releaseHold(kUuid, r); }, "lock", {{"uuids", Array{kUuid}}}},
  };
  for (const Case& each : cases) {
    Dictionary expected = each.keys;
    expected.set("request", each.type);
    expected.set("version", 3U);
    const bool synchronous = expected.contains("sync");
    auto served = serveOne();
    each.send(keep());
    if (synchronous) {
      EXPECT_EQ(replied_.wait_for(std::chrono::seconds(0)), std::future_status::ready);
    }
    EXPECT_EQ(XTDaemonClient::errorInReply(kept()), std::nullopt);
    EXPECT_EQ(onQueue_, !synchronous) << each.type;
    EXPECT_EQ(replyThread_ == std::this_thread::get_id(), synchronous);
    const Peer::Request request = served.get();
    EXPECT_EQ(request.header.type, IpcFrameType::Request);
    EXPECT_EQ(request.body, encoded(expected)) << platform::decodeValue(request.body, nullptr).describe();
  }
}

TEST_F(XTDaemonClientTest, TrafficIsLoggedAtDebugLevelWithoutWholeTokens) {
  tests::LogCapture log("default,traffic=debug");
  client_->accessPlugIns({}, false, 0, keep());
  peer_->reply(peer_->read().header.id, {{"extensions", Array{"0123456789abcdef", "short"}}});
  EXPECT_EQ(kept().body["extensions"].at(0), Value("0123456789abcdef"));
  EXPECT_EQ(log.take(), (std::vector<std::string>{
                            "DEBUG traffic: request: {flags: 0, paths: [], request: \"access\", uuids: [], version: 3}",
                            "DEBUG traffic: reply: {extensions: [\"01234567...\", \"short\"]}"}));
}

TEST(XTDaemonClient, ErrorsInReplies) {
  const auto errorIn = [](Dictionary body) { return XTDaemonClient::errorInReply({std::move(body), std::nullopt}); };
  EXPECT_EQ(errorIn({}), std::nullopt);
  EXPECT_EQ(errorIn({{"errorcode", 0U}}), std::nullopt);
  EXPECT_EQ(errorIn({{"errorcode", 15}}), std::nullopt);  // signed: reads as absent
  EXPECT_EQ(errorIn({{"errorcode", 15U}, {"error", "Cannot locate PlugIn"}}), makeError(15, "Cannot locate PlugIn"));
  EXPECT_EQ(errorIn({{"errorcode", 9U}}), makeError(9, "unknown error returned by Extora subsystem"));
  EXPECT_THROW((void)errorIn({{"error", "text"}}), platform::InternalInconsistency);
  EXPECT_EQ(XTDaemonClient::errorInReply({{}, IpcError{IpcError::Kind::ConnectionInvalid, "gone"}}),
            makeError(4, "gone"));
}

TEST(XTDaemonClient, FormsAreEncodedForVersion3Alone) {
  const Value forms = Array{Dictionary{{"lastmodified", 0}, {"hubProtocolVersion", 2U}, {"hash", Value::data({1})}}};
  EXPECT_TRUE(XTDaemonClient::convertToIPC(forms, 2).isNothing());
  const Value message = XTDaemonClient::convertToIPC(forms, 3);
  ASSERT_TRUE(message.isMessage());
  const auto client = XTDaemonClient::initWithServiceName("com.example.nobody");
  EXPECT_EQ(client->convertFromIPC(message), forms);
  EXPECT_TRUE(client->convertFromIPC(Value::message({0xC1})).isNothing());
  client->setProtocolVersion(2);
  EXPECT_TRUE(client->convertFromIPC(message).isNothing());
}

}  // namespace
}  // namespace extora
