// The wire protocol between hosts and the daemon: request types, keys, versions, flags and error codes. Constants only:
// for any thread.
#pragma once

#include <cstdint>
#include <string_view>

namespace extora {

/// The named service of a daemon that was not given another name.
inline constexpr std::string_view XTDDefaultServiceName = "com.orvane.extora.xtd";

/// The protocol version that clients speak and forms are encoded for.
inline constexpr std::uint64_t XTDProtocolVersion = 3;
/// The oldest version that is still served.
inline constexpr std::uint64_t XTDOldestProtocolVersion = 2;

// Request types: the value under XTDRequestKey, compared exactly.

inline constexpr std::string_view XTDAddRequest = "add";
inline constexpr std::string_view XTDRemoveRequest = "remove";
inline constexpr std::string_view XTDBulkRequest = "bulk";
inline constexpr std::string_view XTDMatchRequest = "match";
inline constexpr std::string_view XTDReadyRequest = "ready";
inline constexpr std::string_view XTDAccessRequest = "access";
inline constexpr std::string_view XTDAnnotateRequest = "annotate";
inline constexpr std::string_view XTDBulkAnnotateRequest = "bulk-annotate";
inline constexpr std::string_view XTDLockdownRequest = "lock";
inline constexpr std::string_view XTDFindRequest = "find";

// Request keys.

/// String: the request type.
inline constexpr std::string_view XTDRequestKey = "request";
/// Unsigned: the protocol version.
inline constexpr std::string_view XTDVersionKey = "version";
/// Boolean: the sender waits for the reply.
inline constexpr std::string_view XTDSynchronousRequestKey = "sync";
/// Array of absolute paths; in "find" one string, a file URL.
inline constexpr std::string_view XTDPathsKey = "paths";
/// Array of UUIDs; in "find", and in the reply to a granted "lock", one UUID.
inline constexpr std::string_view XTDUUIDKey = "uuids";
/// Unsigned: see the flags below.
inline constexpr std::string_view XTDFlagsKey = "flags";
/// Dictionary: match rules.
inline constexpr std::string_view XTDRulesKey = "rules";
/// Dictionary: variables for the plug-ins that are made ready.
inline constexpr std::string_view XTDEnvironmentKey = "environment";
/// Dictionary: what to annotate plug-ins with.
inline constexpr std::string_view XTDAnnotationsKey = "annotations";
/// No request carries it.
inline constexpr std::string_view XTDIdentifierKey = "identifier";

// Reply keys.

/// Unsigned, absent on success: an XTErrorCode.
inline constexpr std::string_view XTDErrorCodeKey = "errorcode";
/// String: why the request failed.
inline constexpr std::string_view XTDErrorKey = "error";
/// Message: the plug-in forms of "match" (an array) or the one of "find".
inline constexpr std::string_view XTDMatchesKey = "matches";
/// Array: what "access" answers.
inline constexpr std::string_view XTDExtensionsKey = "extensions";
/// Array of dictionaries: why a "lock" was refused.
inline constexpr std::string_view XTDConflictsKey = "conflicts";

/// Flags of "match".
enum XTDiscoverFlags : std::uint64_t {
  /// Keep every version of an identifier; only equal versions are reduced to one.
  XTDiscoverAllVersions = 0x1,
  /// With XTDiscoverAllVersions: keep equal versions too.
  XTDiscoverDuplicates = 0x4,
  /// Leave out what is not on the system volume.
  XTDiscoverSystemOnly = 0x8,
  /// Skip the host-specific checks; for managers.
  XTDiscoverAll = 0x200,
  /// The client library sends the request synchronously; the daemon ignores the bit.
  XTDiscoverSynchronously = 0x400,
};

/// Flags of "lock".
enum XTHoldFlags : std::uint64_t {
  /// Each path names a plug-in bundle; without it, an application, all of whose plug-ins are meant.
  XTHoldFlagPlugInPaths = 1,
  /// Refuse the hold when a plug-in is busy.
  XTHoldFlagRefuseBusy = 2,
  /// Once the hold is in force, end the running instances, and reply only after that.
  XTHoldFlagTerminate = 4,
};

/// Codes of the domain "Extora". All but XTErrorLocalizedInfo travel under XTDErrorCodeKey.
enum XTErrorCode : std::int64_t {
  /// A record's localized metadata cannot be answered; stays within the process.
  XTErrorLocalizedInfo = -1,
  /// The application registry refused.
  XTErrorRegistry = 2,
  /// The request is malformed or names an unknown plug-in; also the code of a failed transport.
  XTErrorRequest = 4,
  /// An interface description is malformed.
  XTErrorInterface = 6,
  /// The protocol or database version is not the one that is needed.
  XTErrorVersion = 7,
  /// A path is not absolute or names nothing usable.
  XTErrorPath = 9,
  /// The caller may not do this.
  XTErrorNotPermitted = 11,
  /// A plug-in is configured wrongly.
  XTErrorConfiguration = 12,
  /// Plug-ins are busy.
  XTErrorBusy = 14,
  /// No such plug-in.
  XTErrorNotFound = 15,
  /// An entry of a bulk annotation is malformed.
  XTErrorAnnotation = 18,
};

}  // namespace extora
