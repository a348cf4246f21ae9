// Whatever a daemon may send as a form: a record that sets up from it exports, and what it exports sets up again as the
// same record with the same form, over the wire too.
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "Extora/XTDaemonClient.h"
#include "Extora/XTPlugInCore.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/log/Log.h"

namespace {

class NoLog : public platform::LogSink {
  void write(std::string_view, std::string_view, platform::LogLevel, std::string_view) override {}
};

void require(bool condition, const char* what) {
  if (condition) return;
  std::fprintf(stderr, "not so: %s\n", what);
  std::abort();
}

platform::Bytes encoded(const platform::Value& value) {
  platform::Bytes bytes;
  platform::encodeValue(value, bytes);
  return bytes;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using extora::XTDaemonClient;
  using extora::XTPlugInCore;
  static const bool quiet = (platform::Log::setSink(std::make_shared<NoLog>()), true);
  (void)quiet;

  const platform::Value form = platform::decodeValue({data, size}, nullptr);
  const auto record = XTPlugInCore::initWithForm(form);
  if (record == nullptr) return 0;
  (void)record->diagnose();

  platform::Error error;
  const platform::Value exported = record->exportForm(&error);
  if (exported.isNothing()) {
    require(error.code == 12 && error.description, "a record without a form says what it lacks");
    return 0;
  }
  const platform::Value received = platform::fromWireMessage(XTDaemonClient::convertToIPC(exported, 3));
  const auto rebuilt = XTPlugInCore::initWithForm(received);
  require(rebuilt != nullptr, "an exported form sets up");
  require(*rebuilt == *record, "it is the same record");
  require(encoded(rebuilt->exportForm(nullptr)) == encoded(exported), "its form is the same");
  return 0;
}
