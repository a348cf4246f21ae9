#include "platform/interfaces/InterfaceDescription.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>

namespace platform {
namespace {

bool isOfClass(const Value& value, const std::string& name) {
  switch (value.kind()) {
    case Kind::String:
      return name == "String";
    case Kind::Boolean:
      return name == "Boolean" || name == "Number";
    case Kind::Signed:
    case Kind::Unsigned:
    case Kind::Real:
      return name == "Number";
    case Kind::Data:
      return name == "Data";
    case Kind::Date:
      return name == "Date";
    case Kind::Uuid:
      return name == "UUID";
    case Kind::Array:
      return name == "Array";
    case Kind::Dictionary:
      return name == "Dictionary";
    default:
      return false;
  }
}

// The narrowest class of a value, for a text.
std::string classOf(const Value& value) {
  if (value.kind() == Kind::Boolean) return "Boolean";
  const auto* const found = std::find_if(std::begin(kValueClasses), std::end(kValueClasses),
                                         [&](const char* name) { return isOfClass(value, name); });
  return found == std::end(kValueClasses) ? "value of no class" : *found;
}

}  // namespace

bool isValueClass(const std::string& name) {
  return std::find(std::begin(kValueClasses), std::end(kValueClasses), name) != std::end(kValueClasses);
}

void InterfaceDescription::addOperation(const std::string& operation) {
  const MutexLock lock(mutex_);
  operations_[operation];
}

void InterfaceDescription::restrict(const std::string& operation, Side side, std::size_t index,
                                    std::set<std::string> classes) {
  setRule(operation, side, index, {std::move(classes), nullptr});
}

void InterfaceDescription::bind(const std::string& operation, Side side, std::size_t index,
                                std::shared_ptr<const InterfaceDescription> interface) {
  setRule(operation, side, index, {{}, std::move(interface)});
}

void InterfaceDescription::setRule(const std::string& operation, Side side, std::size_t index, Rule rule) {
  const MutexLock lock(mutex_);
  Operation& of = operations_[operation];
  (side == Side::Request ? of.request : of.reply)[index] = std::move(rule);
}

void InterfaceDescription::adopt(std::shared_ptr<const InterfaceDescription> interface) {
  const MutexLock lock(mutex_);
  adopted_.push_back(std::move(interface));
}

bool InterfaceDescription::offers(const std::string& operation) const {
  return rulesOf(operation, Side::Request).has_value();
}

std::optional<std::map<std::size_t, InterfaceDescription::Rule>> InterfaceDescription::rulesOf(
    const std::string& operation, Side side) const {
  std::vector<std::shared_ptr<const InterfaceDescription>> adopted;
  {
    const MutexLock lock(mutex_);
    if (const auto found = operations_.find(operation); found != operations_.end()) {
      return side == Side::Request ? found->second.request : found->second.reply;
    }
    adopted = adopted_;
  }
  for (const auto& interface : adopted) {
    if (auto rules = interface->rulesOf(operation, side)) return rules;
  }
  return std::nullopt;
}

std::optional<std::string> InterfaceDescription::faultOf(const std::string& operation, Side side,
                                                         const Value& arguments) const {
  const auto rules = rulesOf(operation, side);
  if (!rules) return fmt::format("the interface {} has no operation \"{}\"", name_, operation);
  const char* const what = side == Side::Request ? "argument" : "reply argument";
  if (!arguments.isArray()) return fmt::format("the {}s of \"{}\" are no array", what, operation);
  for (const auto& [index, rule] : *rules) {
    if (index >= arguments.size()) return fmt::format("{} {} of \"{}\" is missing", what, index, operation);
    if (const auto fault = faultOfArgument(rule, arguments.at(index))) {
      return fmt::format("{} {} of \"{}\" {}", what, index, operation, *fault);
    }
  }
  return std::nullopt;
}

std::optional<std::string> InterfaceDescription::faultOfArgument(const Rule& rule, const Value& argument) {
  if (rule.interface != nullptr) {
    const auto fault = rule.interface->faultOfInvocation(argument);
    return fault ? std::optional("is no invocation: " + *fault) : std::nullopt;
  }
  for (const std::string& name : rule.classes) {
    if (isOfClass(argument, name)) return std::nullopt;
  }
  return fmt::format("is of class {}, not {}", classOf(argument), fmt::join(rule.classes, " or "));
}

std::optional<std::string> InterfaceDescription::faultOfInvocation(const Value& invocation) const {
  const Value& operation = invocation["operation"];
  if (!operation.isString()) return "it names no operation";
  return faultOf(operation.string(), Side::Request, invocation["arguments"]);
}

}  // namespace platform
