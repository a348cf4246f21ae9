// A host: finds the plug-ins of one extension point, and uses each of them.
//
//   sample-host EXTENSION-POINT [TEXT [FILE]]
//
// prints what it may use. With a TEXT it makes each plug-in ready, launches it, lets it work on the text, and prints
// what comes back; with a FILE it also reads that file of the plug-in's bundle, by means of the sandbox extension that
// came with the plug-in: a host in a sandbox could not read it otherwise.
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <optional>

#include "Extora/XTBundle.h"
#include "Extora/XTDaemonClient.h"
#include "Extora/XTHostServices.h"
#include "Extora/XTPlugInConnection.h"
#include "Extora/XTPlugInCore.h"
#include "Extora/XTSandboxExtension.h"
#include "examples/EditingInterface.h"

using extora::Error;
using extora::XTDaemonClient;
using platform::Value;

namespace {

bool complain(const char* what, const std::optional<Error>& error) {
  std::fprintf(stderr, "sample-host: %s: %s\n", what, error ? error->localizedDescription().c_str() : "failed");
  return false;
}

// The forms of the plug-ins that this host is offered.
std::optional<Value> discover(XTDaemonClient& client, const std::string& extensionPoint) {
  const platform::Dictionary rules{{extora::XTProtocolAttribute, extensionPoint}};
  std::optional<Value> forms;
  // With this flag the reply function has been called, on this thread, when matchPlugIns returns.
  client.matchPlugIns(rules, extora::XTDiscoverSynchronously, [&](const platform::IpcReplyObject& reply) {
    if (const auto error = XTDaemonClient::errorInReply(reply)) {
      complain("discovery", error);
    } else {
      forms = client.convertFromIPC(reply.body[extora::XTDMatchesKey]);
    }
  });
  return forms;
}

// Makes the plug-in ready for this process, launches it, and prints what it makes of the text.
bool use(XTDaemonClient& client, const extora::XTPlugInCore& plugIn, const std::string& text) {
  std::optional<Error> error;
  client.readyPlugIns({{plugIn.path(), plugIn.uuid()}}, true, 0, {},
                      [&](const auto& reply) { error = XTDaemonClient::errorInReply(reply); });
  if (error) return complain("ready", error);

  Error refusal;
  const auto executable = extora::XTBundle::initWithURL(plugIn.url())->executablePath().value_or("");
  auto launched = extora::XTHostServices::launch(executable, &refusal);
  if (!launched) return complain("launch", refusal);
  const platform::SerialQueue queue("sample-host");
  const auto connection = extora::XTPlugInConnection::initWithSocket(std::move(launched->connection), queue);
  connection->setRemoteInterface(editingInterface());
  connection->resume();
  const auto answer = connection->call("apply", {text});
  if (answer.error) return complain("apply", answer.error);
  std::printf("  says: %s\n", answer.arguments[0].string().c_str());
  return true;
}

// Prints the first line of a file of the plug-in's bundle.
bool read(const Value& form, const char* file) {
  extora::XTSandboxExtension extension(form[extora::XTExtensionsFormKey]["."].string());
  extension.consume();
  const platform::UniqueFd opened(::openat(extension.descriptor(), file, O_RDONLY | O_CLOEXEC));
  std::array<char, 256> text{};
  if (!opened || ::read(opened.get(), text.data(), text.size() - 1) < 0) return complain(file, std::nullopt);
  std::printf("  brings: %.*s\n", static_cast<int>(std::string_view(text.data()).find('\n')), text.data());
  return true;  // the destruction of the extension gives up what it granted
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2 || argc > 4) {
    std::fputs("usage: sample-host EXTENSION-POINT [TEXT [FILE]]\n", stderr);
    return 2;
  }
  const auto client = XTDaemonClient::initWithServiceName(std::nullopt);
  const auto forms = discover(*client, argv[1]);
  if (!forms) return 1;
  bool good = true;
  for (const Value& form : forms->items()) {
    const auto plugIn = extora::XTPlugInCore::initWithForm(form);
    if (!plugIn) continue;
    std::printf("%s %s (%s)\n", plugIn->localizedName().value_or(plugIn->identifier()).c_str(),
                plugIn->version().value_or("").c_str(), plugIn->identifier().c_str());
    if (argc > 2 && !plugIn->isData()) good = use(*client, *plugIn, argv[2]) && good;
    if (argc > 3) good = read(form, argv[3]) && good;
  }
  return good ? 0 : 1;
}
