#include "Extora/XTInterface.h"

#include <algorithm>
#include <limits>
#include <set>
#include <string_view>

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "platform/interfaces/InterfaceRegistry.h"

namespace extora {

using platform::InterfaceDescription;
using platform::InterfaceRegistry;

namespace {

std::vector<std::string> split(std::string_view text, char separator) {
  std::vector<std::string> parts;
  for (;;) {
    const std::size_t at = text.find(separator);
    parts.emplace_back(text.substr(0, at));
    if (at == std::string_view::npos) return parts;
    text.remove_prefix(at + 1);
  }
}

// The value of the leading decimal digits; 0 without any, the largest index for more than fits.
std::size_t indexOf(const std::string& text) {
  std::size_t index = 0;
  for (const char c : text) {
    if (c < '0' || c > '9') break;
    if (index > (std::numeric_limits<std::size_t>::max() - 9) / 10) return std::numeric_limits<std::size_t>::max();
    index = index * 10 + static_cast<std::size_t>(c - '0');
  }
  return index;
}

std::optional<Error> applyType(InterfaceDescription& interface, const std::string& operation,
                               InterfaceDescription::Side side, std::size_t index, const std::string& type) {
  if (!type.starts_with('{')) {
    auto bound = lookUpInterface(type);
    if (bound == nullptr) return makeError(XTErrorInterface, type);
    interface.bind(operation, side, index, std::move(bound));
    return std::nullopt;
  }
  if (!type.ends_with('}')) return makeError(XTErrorInterface, type);
  std::set<std::string> classes;
  for (std::string& name : split(std::string_view(type).substr(1, type.size() - 2), '+')) {
    if (!platform::isValueClass(name)) return makeError(XTErrorInterface, name);
    classes.insert(std::move(name));
  }
  interface.restrict(operation, side, index, std::move(classes));
  return std::nullopt;
}

}  // namespace

std::optional<Error> applyInterfaceSpec(InterfaceDescription& interface, const std::string& operation,
                                        const std::string& clauses) {
  for (const std::string& entry : split(clauses, ',')) {
    const auto parts = split(entry, ':');
    if (parts.size() != 3) return makeError(XTErrorInterface, clauses);
    if (parts[0] != "request" && parts[0] != "reply") return makeError(XTErrorInterface, parts[0]);
    const auto side = parts[0] == "reply" ? InterfaceDescription::Side::Reply : InterfaceDescription::Side::Request;
    if (auto error = applyType(interface, operation, side, indexOf(parts[1]), parts[2])) return error;
  }
  return std::nullopt;
}

std::shared_ptr<InterfaceDescription> lookUpInterface(const std::string& name, Error* error) {
  if (auto found = InterfaceRegistry::shared().find(name)) return found;
  const std::string text = fmt::format(
      "unable to locate protocol \"{}\" - check that it is defined and not inadvertently optimized away", name);
  XTLogOps().def("{}", text);
  platform::setError(error, makeError(XTErrorConfiguration, text));
  return nullptr;
}

std::shared_ptr<InterfaceDescription> compoundInterface(const platform::Value& names, Error* error) {
  if (names.isString()) return lookUpInterface(names.string(), error);
  const auto items = names.items();
  if (!names.isArray() || !std::all_of(items.begin(), items.end(), [](const auto& item) { return item.isString(); })) {
    return nullptr;
  }
  std::string compound = "__XX_COMPOUND";
  for (const auto& item : items) compound += "__" + item.string();
  InterfaceRegistry& registry = InterfaceRegistry::shared();
  const auto made = registry.create(compound);
  if (made == nullptr) {
    auto existing = registry.find(compound);
    if (existing == nullptr) {
      platform::setError(error, makeError(XTErrorConfiguration, "unable to create compound protocol"));
    }
    return existing;
  }
  for (const auto& item : items) {
    auto part = lookUpInterface(item.string(), error);
    if (part == nullptr) return nullptr;
    made->adopt(std::move(part));
  }
  registry.add(made);
  return made;
}

std::shared_ptr<InterfaceDescription> defineInterface(
    const std::string& name, const std::vector<std::pair<std::string, std::string>>& operations, Error* error) {
  auto made = InterfaceRegistry::shared().create(name);
  if (made == nullptr) {
    platform::setError(error, makeErrorWithFormat(XTErrorConfiguration, "the interface {} exists already", name));
    return nullptr;
  }
  for (const auto& [operation, clauses] : operations) {
    made->addOperation(operation);
    if (clauses.empty()) continue;
    if (auto wrong = applyInterfaceSpec(*made, operation, clauses)) {
      platform::setError(error, std::move(*wrong));
      return nullptr;
    }
  }
  InterfaceRegistry::shared().add(made);
  return made;
}

}  // namespace extora
