// Asks a service that nobody serves for a plug-in and prints the error. Ends with 0 when that is the answer.
#include <Extora/XTDaemonClient.h>

#include <cstdio>
#include <future>
#include <memory>

int main() {
  const auto client = extora::XTDaemonClient::initWithServiceName("com.example.nobody");
  const auto answer = std::make_shared<std::promise<std::optional<extora::Error>>>();
  client->findPlugInByUUID(platform::Uuid::random(), [answer](const platform::IpcReplyObject& reply) {
    answer->set_value(extora::XTDaemonClient::errorInReply(reply));
  });
  const std::optional<extora::Error> error = answer->get_future().get();
  if (!error) return 1;
  std::printf("%s\n", error->describe().c_str());
  return error->code == extora::XTErrorRequest ? 0 : 1;
}
