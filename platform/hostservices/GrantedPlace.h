// Opening what a file token grants. Free functions, for any thread; they may take a few milliseconds.
#pragma once

#include "platform/files/UniqueFd.h"
#include "platform/sandbox/ExtensionTokens.h"

namespace platform {

/// What is handed to whoever consumes the token: the file or directory, opened for reading on a detached clone of its
/// mount, from which nothing above it can be reached. That mount is read-only, so that who has the descriptor cannot
/// open it again for writing. Nothing and an error number: ESTALE when the place holds
/// another file by now, or none; otherwise what the system says.
[[nodiscard]] UniqueFd openGrantedPlace(const SandboxGrant& grant, int* errorNumber);

}  // namespace platform
