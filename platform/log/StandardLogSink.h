// StandardLogSink: where lines go unless a program says otherwise: journald's native fields when standard error is the
// journal, else one text line "LEVEL category: message" on standard error, preceded by a timestamp and the process id
// when that is a terminal.
//
// Without state; lines of several threads do not mix, since each is one write. What standard error does not take within
// a second is dropped, so that a stuck reader never stops the process.
#pragma once

#include <array>
#include <string>
#include <string_view>

#include "platform/log/Log.h"

namespace platform {

/// Bytes of a message that are kept; what is beyond is cut off and counted in a mark.
inline constexpr std::size_t kMaxLogMessage = std::size_t{256} << 10;

class StandardLogSink : public LogSink {
 public:
  /// `fd` stays the caller's. `journalStream` is the text of JOURNAL_STREAM ("device:inode") or empty.
  StandardLogSink(int fd, std::string_view journalStream);
  void write(std::string_view subsystem, std::string_view category, LogLevel level, std::string_view message) override;

  /// Whether `fd` is the stream that `journalStream` names.
  static bool isJournal(int fd, std::string_view journalStream);
  /// "LEVEL category: message" without a line end; control characters are escaped.
  static std::string textLine(std::string_view category, LogLevel level, std::string_view message);
  /// MESSAGE, PRIORITY, CATEGORY and, unless it is empty, SUBSYSTEM: each "NAME=value"; an unused one is empty.
  static std::array<std::string, 4> journalFields(std::string_view subsystem, std::string_view category, LogLevel level,
                                                  std::string_view message);

 private:
  const int fd_;
  const bool journal_;
  const bool terminal_;
};

}  // namespace platform
