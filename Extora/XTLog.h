// XTLog: the log categories of the subsystem "com.orvane.Extora", each made once and kept for the life of the process.
#pragma once

#include "platform/log/Log.h"

namespace extora {

inline constexpr const char* XTLogSubsystem = "com.orvane.Extora";

/// Everything not listed below.
const platform::Log& XTLogOps();
/// Request traffic: look-ups of UUID lists; the client library's request and reply lines.
const platform::Log& XTLogTraffic();
/// Matching of plug-ins against rules.
const platform::Log& XTLogExtension();
/// Dealings with the application registry.
const platform::Log& XTLogAr();
/// Issuing and consuming sandbox extensions.
const platform::Log& XTLogSandbox();

/// The level of lines that are faults on builds with internal diagnostics and errors otherwise; asked once.
platform::LogLevel XTLogFaultOrError();

}  // namespace extora
