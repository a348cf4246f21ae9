// InterfaceDescription: the operations that one side of a connection offers to the other, and what their arguments and
// the arguments of their replies may be.
//
// An argument without a rule may be anything. A rule restricts it to classes of values, or binds it to an interface: it
// then is an invocation of that interface, {"operation": name, "arguments": [...]}, which whoever gets it may send
// back. For any thread; descriptions are shared and never copied.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace platform {

/// The names of classes that arguments can be restricted to. A Boolean is a Number too.
inline constexpr const char* kValueClasses[] = {"String", "Number", "Boolean", "Data",
                                                "Date",   "UUID",   "Array",   "Dictionary"};
bool isValueClass(const std::string& name);

class InterfaceDescription {
 public:
  /// Which arguments a rule is about.
  enum class Side { Request, Reply };

  explicit InterfaceDescription(std::string name) : name_(std::move(name)) {}
  InterfaceDescription(const InterfaceDescription&) = delete;
  InterfaceDescription& operator=(const InterfaceDescription&) = delete;

  const std::string& name() const { return name_; }

  /// Offers an operation; a rule for an operation does so too.
  void addOperation(const std::string& operation);
  /// The argument at `index` must be of one of `classes`. Replaces an earlier rule.
  void restrict(const std::string& operation, Side side, std::size_t index, std::set<std::string> classes);
  /// The argument at `index` must be an invocation of `interface`. Replaces an earlier rule.
  void bind(const std::string& operation, Side side, std::size_t index,
            std::shared_ptr<const InterfaceDescription> interface);
  /// Offers what `interface` offers besides; an operation of its own comes first.
  void adopt(std::shared_ptr<const InterfaceDescription> interface);

  bool offers(const std::string& operation) const;
  /// Why these are no arguments for the operation (or for its reply); nothing when they are. `arguments` is an array.
  std::optional<std::string> faultOf(const std::string& operation, Side side, const Value& arguments) const;
  /// Why this is no invocation of the interface: faultOf its operation and arguments.
  std::optional<std::string> faultOfInvocation(const Value& invocation) const;

 private:
  struct Rule {
    std::set<std::string> classes;
    std::shared_ptr<const InterfaceDescription> interface;
  };
  struct Operation {
    std::map<std::size_t, Rule> request;
    std::map<std::size_t, Rule> reply;
  };
  static std::optional<std::string> faultOfArgument(const Rule& rule, const Value& argument);
  void setRule(const std::string& operation, Side side, std::size_t index, Rule rule);
  /// The rules of the operation, of this or an adopted interface; nothing when none of them offers it.
  std::optional<std::map<std::size_t, Rule>> rulesOf(const std::string& operation, Side side) const;

  const std::string name_;
  mutable Mutex mutex_;
  std::map<std::string, Operation> operations_ XT_GUARDED_BY(mutex_);
  std::vector<std::shared_ptr<const InterfaceDescription>> adopted_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
