// What the launcher and xtd-launch, the first process of a sandbox, have agreed on.
//
// 1. bubblewrap is started with the descriptors below and starts xtd-launch, which sends one byte and, as its
// descriptor,
//    its own pidfd over the control socket: the launcher's only sure way to know it by the launcher's own process ids.
// 2. The launcher puts it on record and sends one byte: go on. The end of input instead of it: give up.
// 3. xtd-launch starts the executable. The end of input: the executable runs. An error number (int) before it: it could
//    not be executed.
// The plan is a memory file of texts, each ended by a NUL: the executable, then its environment as NAME=VALUE. So
// nothing of it is ever part of the environment or the command line of bubblewrap or xtd-launch.
#pragma once

namespace platform::launch {

/// 0 to 2: /dev/null for the plug-in; bubblewrap has a file for its complaints as 2.
inline constexpr int kNullDescriptor = 0;
inline constexpr int kComplaintsDescriptor = 2;
/// The plug-in's end of the connection; xtd-launch keeps none.
inline constexpr int kConnectionDescriptor = 3;
inline constexpr int kControlDescriptor = 4;
inline constexpr int kPlanDescriptor = 5;
/// bubblewrap's options.
inline constexpr int kOptionsDescriptor = 6;
inline constexpr const char* kOptionsNumber = "6";
/// The opened xtd-launch, so that it need not lie anywhere in the sandbox.
inline constexpr int kProgramDescriptor = 7;
inline constexpr const char* kProgramPath = "/proc/self/fd/7";
inline constexpr int kFirstFreeDescriptor = 8;

inline constexpr char kRunning = 'r';
inline constexpr char kGoOn = 'g';

/// The exit status when the executable could not be started, as shells have it.
inline constexpr int kCannotExecute = 127;
/// Added to the number of the signal that ended the executable.
inline constexpr int kEndedBySignal = 128;

}  // namespace platform::launch
