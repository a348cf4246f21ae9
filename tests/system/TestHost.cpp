// test_host: a host process that a test puts where it needs one (into a bundle, beside an entitlements file).
//
//   test_host RUNTIME SERVICE FLAGS [IDENTIFIER]
//
// sends one "match" (for one identifier, or without rules) and prints "identifier version path" of each plug-in that it
// is offered, sorted, one a line; or "error CODE TEXT".
#include <cstdio>
#include <cstdlib>
#include <set>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTVocabulary.h"
#include "platform/ipc/IpcCodec.h"

using namespace extora;
using platform::Dictionary;
using platform::Value;

int main(int argc, char* argv[]) {
  if (argc < 4) return 2;
  const platform::SerialQueue queue("test_host");
  const auto connection = platform::ipcConnectService(argv[1], argv[2], queue);
  connection->setEventHandler([](const platform::IpcEvent&) {});
  connection->resume();
  Dictionary request = {{XTDRequestKey, XTDMatchRequest},
                        {XTDVersionKey, XTDProtocolVersion},
                        {XTDFlagsKey, std::uint64_t{std::strtoull(argv[3], nullptr, 0)}}};
  if (argc > 4) request.set(XTDRulesKey, Dictionary{{XTIdentifierAttribute, std::string(argv[4])}});
  const auto reply = connection->sendWithReplySync(request);
  if (const auto error = XTDaemonClient::errorInReply(reply)) {
    std::printf("error %lld %s\n", static_cast<long long>(error->code), error->localizedDescription().c_str());
    return 1;
  }
  std::set<std::string> lines;
  const Value forms = platform::fromWireMessage(reply.body[XTDMatchesKey]);
  for (const Value& form : forms.items()) {
    lines.insert(form[XTIdentifierFormKey].string() + " " + form[XTVersionFormKey].string() + " " +
                 form[XTPathFormKey].string() + "\n");
  }
  for (const auto& line : lines) std::fputs(line.c_str(), stdout);
  return 0;
}
