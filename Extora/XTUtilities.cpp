#include "Extora/XTUtilities.h"

namespace extora {

std::weak_ordering compareVersionString(std::string_view receiver, std::string_view other) noexcept {
  return platform::compareNumeric(receiver, other);
}

Dictionary dictionaryChanging(const Dictionary& receiver, std::string_view key, const Value& value) {
  Dictionary result = receiver;
  result.set(key, value);
  return result;
}

}  // namespace extora
