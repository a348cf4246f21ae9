// The names that the host services and their clients have in common. Every request is a map with kOperationKey; a
// refusal carries kErrnoKey and kErrorKey.
#pragma once

namespace platform {

/// The service.
inline constexpr const char* kHostServices = "com.orvane.platform";

inline constexpr const char* kOperationKey = "operation";  ///< string: one of the five
inline constexpr const char* kErrnoKey = "errno";          ///< unsigned: a system error number
inline constexpr const char* kErrorKey = "error";          ///< string

/// kExecutableKey -> kPidKey, kConnectionKey
inline constexpr const char* kLaunchOperation = "launch";
/// kTokenKey -> kHandleKey and, for a file token, kDescriptorKey
inline constexpr const char* kConsumeOperation = "consume";
/// kHandleKey -> nothing
inline constexpr const char* kReleaseOperation = "release";
/// nothing -> nothing
inline constexpr const char* kBeginActivityOperation = "begin-activity";
inline constexpr const char* kEndActivityOperation = "end-activity";

inline constexpr const char* kExecutableKey = "executable";  ///< string: a path
inline constexpr const char* kPidKey = "pid";                ///< unsigned: of the sandbox's first process
inline constexpr const char* kConnectionKey = "connection";  ///< descriptor: a connected socket
inline constexpr const char* kTokenKey = "token";            ///< string
inline constexpr const char* kHandleKey = "handle";          ///< signed, above 0
inline constexpr const char* kDescriptorKey = "descriptor";  ///< descriptor: what the token grants

}  // namespace platform
