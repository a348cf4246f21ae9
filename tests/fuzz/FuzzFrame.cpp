// A frame from outside: its header and its body are read or refused with a reason; what was read has one encoding,
// which reads back the same, whatever a message inside holds.
#include <cstdlib>

#include "platform/ipc/IpcCodec.h"
#include "platform/ipc/IpcFrame.h"

using namespace platform;

namespace {

// Opens every message inside, to the end.
void openMessages(const Value& value) {
  if (value.isMessage()) openMessages(fromWireMessage(value));
  for (const Value& item : value.items()) openMessages(item);
  for (const Value::Entry& entry : value.entries()) openMessages(entry.value);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::span<const std::uint8_t> input(data, size);
  if (size < IpcFrameHeader::kSize) return 0;
  Error error;
  const auto head = input.first<IpcFrameHeader::kSize>();
  if (const std::optional<IpcFrameHeader> header = IpcFrameHeader::parse(head, &error)) {
    const auto again = header->serialize();
    if (!std::equal(again.begin(), again.end(), head.begin())) std::abort();
  } else if (error.code != kIpcErrorMalformed) {
    std::abort();
  }

  error = {};
  const Value value = decodeValue(input.subspan(IpcFrameHeader::kSize), &error);
  if (value.isNothing()) {
    if (error.code != kIpcErrorMalformed || !error.description) std::abort();
    return 0;
  }
  Bytes once;
  encodeValue(value, once);
  const Value read = decodeValue(once, &error);
  Bytes twice;
  encodeValue(read, twice);
  // Bytes and not values are compared, because a real may be no number.
  if (read.kind() != value.kind() || once != twice) std::abort();
  (void)value.describe();
  openMessages(value);
  return 0;
}
