#include "Extora/XTError.h"

#include <utility>

namespace extora {

Error makeError(std::int64_t code, std::optional<std::string> description) {
  return {XTExtoraErrorDomain, code, std::move(description)};
}

}  // namespace extora
