// ExitStatus: how a tool ends; the same in every command.
#pragma once

namespace tools {

enum class ExitStatus : int {
  Success = 0,
  Refused = 1,      ///< the daemon said no, or the answer could not be written; the reason is on standard error
  Usage = 2,        ///< the command line, or a file named on it, is wrong
  Unreachable = 3,  ///< no daemon answers
};

}  // namespace tools
