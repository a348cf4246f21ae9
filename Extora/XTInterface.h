// Interfaces, which say what may be asked over a connection between a host and a plug-in: found by name, composed, and
// described by a compact text. Callable from any thread.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "Extora/XTError.h"
#include "platform/interfaces/InterfaceDescription.h"
#include "platform/value/Value.h"

namespace extora {

/// Applies rules to the arguments of one operation. The text is a list of entries, separated by commas:
///
///   request:0:{String+Data}    argument 0 is a String or Data
///   reply:1:com.example.sink   argument 1 of the reply is an invocation of the interface of that name
///
/// Nothing on success; else an error of code XTErrorInterface that describes the wrong part. Entries before it stay
/// applied.
[[nodiscard]] std::optional<Error> applyInterfaceSpec(platform::InterfaceDescription& interface,
                                                      const std::string& operation, const std::string& clauses);

/// The interface that is registered under the name (platform::InterfaceRegistry); null, a line in the log and an error
/// of code XTErrorConfiguration when there is none.
[[nodiscard]] std::shared_ptr<platform::InterfaceDescription> lookUpInterface(const std::string& name,
                                                                              Error* error = nullptr);

/// Of a string the interface of that name; of an array of strings one that offers what all of these offer, made with
/// the first call and registered. Null, and an error of code XTErrorConfiguration, when one is missing; null without an
/// error for any other value.
[[nodiscard]] std::shared_ptr<platform::InterfaceDescription> compoundInterface(const platform::Value& names,
                                                                                Error* error = nullptr);

/// Registers an interface of these operations, each with its rules as applyInterfaceSpec takes them (an empty text for
/// none). Null and `error` when a rule is wrong or the name is taken.
[[nodiscard]] std::shared_ptr<platform::InterfaceDescription> defineInterface(
    const std::string& name, const std::vector<std::pair<std::string, std::string>>& operations,
    Error* error = nullptr);

}  // namespace extora
