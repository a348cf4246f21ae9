// A host: asks the daemon for the plug-ins of one extension point and prints what it may use.
//
//   sample-host EXTENSION-POINT
//
// This is all that a program needs of libextora to discover plug-ins.
#include <cstdio>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTPlugInCore.h"

int main(int argc, char** argv) {
  using extora::XTDaemonClient;
  using extora::XTPlugInCore;
  if (argc != 2) {
    std::fputs("usage: sample-host EXTENSION-POINT\n", stderr);
    return 2;
  }

  const auto client = XTDaemonClient::initWithServiceName(std::nullopt);
  const platform::Dictionary rules{{extora::XTProtocolAttribute, argv[1]}};
  int status = 1;
  // With this flag the reply function has been called, on this thread, when matchPlugIns returns.
  client->matchPlugIns(rules, extora::XTDiscoverSynchronously, [&](const platform::IpcReplyObject& reply) {
    if (const auto error = XTDaemonClient::errorInReply(reply)) {
      std::fprintf(stderr, "sample-host: %s\n", error->localizedDescription().c_str());
      return;
    }
    const platform::Value forms = client->convertFromIPC(reply.body[extora::XTDMatchesKey]);
    for (const platform::Value& form : forms.items()) {
      const auto plugIn = XTPlugInCore::initWithForm(form);
      if (!plugIn) continue;
      std::printf("%s %s (%s)\n", plugIn->localizedName().value_or(plugIn->identifier()).c_str(),
                  plugIn->version().value_or("").c_str(), plugIn->identifier().c_str());
    }
    status = 0;
  });
  return status;
}
