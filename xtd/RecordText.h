// How registry records read in log lines. Free functions without state, for any thread.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/registry/Records.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

/// The records one after the other in parentheses.
std::string describeRecords(const platform::PlugInRecords& records);

/// "bundle identifier, plug-in identifier(version) UUID path", without the comma; "(null)" for what a record lacks.
std::string describeInstallation(const platform::ARExtoraProxy& record);

/// "[identifier(version) UUID at path, ...]".
std::string describePlugIns(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns);

}  // namespace extora
