// What the commands that use plug-ins share.
#pragma once

#include <CLI/CLI.hpp>

#include <string>
#include <vector>

#include "Extora/XTDaemonClient.h"
#include "platform/value/Value.h"
#include "tools/DaemonSession.h"

namespace tools {

/// Adds --env KEY=VALUE, which fills `environment`.
void addEnvironmentOption(CLI::App& command, std::vector<std::string>& environment);

/// Path and UUID of each of the forms, as requests name plug-ins.
extora::XTDaemonClient::PlugIns plugInsOf(const std::vector<platform::Value>& forms);

/// Has the daemon make the plug-ins of these forms ready for this process; `environment` holds KEY=VALUE texts.
/// Complaints have been written when the status is not Success.
[[nodiscard]] ExitStatus makeReady(DaemonSession& daemon, const std::vector<platform::Value>& forms,
                                   const std::vector<std::string>& environment);

/// An argument as people type it: "true" and "false" are booleans, whole numbers numbers, all else text.
platform::Value typedValue(const std::string& text);

}  // namespace tools
