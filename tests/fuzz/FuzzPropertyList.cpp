// A property list from outside is read or refused with a reason; what was read is written and read back equal.
#include <cstdlib>

#include "platform/plist/PropertyList.h"

using namespace platform;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  Error error;
  const Value value = parsePropertyList({data, size}, &error);
  if (value.isNothing()) {
    if (!error.description || !error.description->starts_with("line ")) std::abort();
    return 0;
  }
  const std::optional<std::string> text = serializeXml(value, &error);
  if (!text) std::abort();
  if (parsePropertyList({reinterpret_cast<const std::uint8_t*>(text->data()), text->size()}, &error) != value) {
    std::abort();
  }
  (void)value.describe();
  return 0;
}
