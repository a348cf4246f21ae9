// How long does a host wait for the daemon's answer? A real xtd in private directories with 10, 100 and 1000 plug-ins,
// asked over its socket by the client library; beside each figure the floor for frames of the same size, measured in
// the same run, so that the figure that counts is the ratio. An annotation is acknowledged when it is on the disk: its
// floor is the bare replacement of a file of the same bytes, beside the daemon's.
#include <fcntl.h>
#include <fmt/format.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>

#include "Extora/XTDaemonClient.h"
#include "bench/Measure.h"
#include "bench/RawEcho.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/ipc/IpcFrame.h"
#include "platform/log/Log.h"
#include "tests/support/Daemon.h"
#include "tests/support/SampleBundles.h"

namespace {

using bench::measure;
using bench::Sample;
using extora::XTDaemonClient;
using platform::Dictionary;
using platform::Value;

// One request through the client library, synchronously; its reply body.
Value ask(XTDaemonClient& client, const Dictionary& request) {
  Value body;
  client.sendSynchronously(true, request, [&](const platform::IpcReplyObject& reply) {
    if (const auto error = XTDaemonClient::errorInReply(reply)) {
      fmt::print(stderr, "bench_daemon: {}\n", error->localizedDescription());
      std::exit(1);
    }
    body = reply.body;
  });
  return body;
}

std::size_t frameSize(const Value& body) {
  platform::Bytes bytes;
  platform::encodeValue(body, bytes);
  return bytes.size() + platform::IpcFrameHeader::kSize;
}

void print(const std::string& what, std::size_t plugIns, std::size_t bytes, const Sample& daemon, const Sample& raw) {
  fmt::print("{:<26}{:>10}{:>14}{:>12.1f}{:>12.1f}{:>12.1f}{:>12.1f}{:>8.1f}\n", what, plugIns, bytes, daemon.median,
             daemon.p99, raw.median, raw.p99, daemon.median / raw.median);
  std::fflush(stdout);
}

void row(const std::string& what, std::size_t installed, XTDaemonClient& client, const Dictionary& request) {
  const std::size_t requestSize = frameSize(request);
  const std::size_t replySize = frameSize(ask(client, request));
  const Sample daemon = measure([&] { (void)ask(client, request); });
  bench::RawEcho echo(requestSize, replySize);
  const Sample raw = measure([&] { echo.roundTrip(); });
  print(what, installed, replySize, daemon, raw);
}

[[noreturn]] void end(const std::string& why) {
  fmt::print(stderr, "bench_daemon: {}\n", why);
  std::exit(1);
}

// What replacing a file for good takes at the least.
void replaceFile(int directory, const std::string& bytes) {
  constexpr const char* kTemporary = "bare.tmp";
  const platform::UniqueFd fd(::openat(directory, kTemporary, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!fd || ::write(fd.get(), bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size()) ||
      ::fsync(fd.get()) != 0 || ::renameat(directory, kTemporary, directory, "bare") != 0 || ::fsync(directory) != 0) {
    end(std::string("cannot replace a file: ") + std::strerror(errno));
  }
}

// One annotation where every one of the plug-ins has one already.
void measureAnnotation(const tests::Daemon& daemon, XTDaemonClient& client, const Value& forms) {
  Dictionary extensions;
  for (const Value& form : forms.items()) {
    extensions.set(form["uuid"].string(), Dictionary{{"colour", "green"}, {"order", 7}});
  }
  Dictionary bulk = client.request("bulk-annotate");
  bulk.set("annotations", extensions);
  (void)ask(client, bulk);

  const platform::UniqueFd directory(::open(daemon.root().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const auto stored = [&] {
    std::ifstream file(daemon.root() / "Extora-Annotations", std::fstream::binary);
    return std::string(std::istreambuf_iterator<char>(file), {});
  };
  Dictionary annotate = client.request("annotate");
  annotate.set("uuids", platform::Array{*platform::Uuid::parse(forms.at(0)["uuid"].string())});
  int election = 0;
  const Sample acknowledged = measure([&] {
    annotate.set("annotations", Dictionary{{"election", ++election}});
    (void)ask(client, annotate);
  });
  const std::string bytes = stored();
  if (bytes.find(fmt::format("<integer>{}</integer>", election)) == std::string::npos) end("nothing is stored");
  const Sample bare = measure([&] { replaceFile(directory.get(), bytes); });
  print("annotate", forms.size(), bytes.size(), acknowledged, bare);
}

void measureWith(std::size_t plugIns) {
  tests::Daemon daemon;
  daemon.setEnvironment("EXTORA_LOG", "default");
  for (const auto& application : tests::sampleApplications(plugIns / 10, 10)) {
    tests::writeBundle(daemon.applications(), application);
  }
  daemon.start();
  ::setenv("EXTORA_RUNTIME_DIR", daemon.runtime().c_str(), 1);
  const auto client = XTDaemonClient::initWithServiceName(std::nullopt);

  Dictionary match = client->request("match");
  const Value forms = client->convertFromIPC(ask(*client, match)["matches"]);
  if (forms.size() != plugIns) end(fmt::format("{} plug-ins are offered, not {}", forms.size(), plugIns));
  Dictionary find = client->request("find");
  find.set("uuids", *platform::Uuid::parse(forms.at(0)["uuid"].string()));
  row("find", plugIns, *client, find);
  row("match, all", plugIns, *client, match);
  match.set("rules", Dictionary{{"HXExtensionIdentifier", forms.at(0)["identifier"]}});
  row("match, one of them", plugIns, *client, match);
  measureAnnotation(daemon, *client, forms);
}

}  // namespace

int main() {
  platform::Log::configure("fault");  // the client's own lines would be part of what is measured
  fmt::print("{:<26}{:>10}{:>14}{:>12}{:>12}{:>12}{:>12}{:>8}\n", "request", "plug-ins", "bytes", "median us", "p99 us",
             "raw median", "raw p99", "ratio");
  for (const std::size_t plugIns : {10, 100, 1000}) measureWith(plugIns);
  return 0;
}
