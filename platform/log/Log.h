// Log: one handle of the platform's structured log: a subsystem, a category, five levels.
//
// Handles are made once and shared by all threads. A message below the enabled level costs one test; its arguments are
// formatted only when the level is enabled. Lines go to journald's native fields when standard error is the journal,
// otherwise as one text line "LEVEL category: message" to standard error.
#pragma once

#include <fmt/format.h>

#include <atomic>
#include <memory>
#include <string>
#include <string_view>

#include "platform/value/Describe.h"

namespace platform {

enum class LogLevel : int { Debug, Info, Default, Error, Fault };

/// Where lines go; the process has one. Called by any thread, one line at a time need not be assumed.
class LogSink {
 public:
  virtual ~LogSink() = default;
  /// `category` is "-" for the process's default log. `message` is one line, not yet escaped.
  virtual void write(std::string_view subsystem, std::string_view category, LogLevel level,
                     std::string_view message) = 0;
  /// Writes out what it holds back, if anything.
  virtual void flush() {}
};

class Log {
 public:
  /// A handle of one's own; configure() after its construction does not reach it.
  Log(std::string subsystem, std::string category);

  /// The handle of a category; made on the first call, the same object for equal arguments afterwards, never released.
  /// Null when it cannot be made: a category name that EXTORA_LOG could not carry (printable ASCII without space, '=',
  /// ',').
  static const Log* named(std::string_view subsystem, std::string_view category);
  /// The process's default log (category "-").
  static const Log& processDefault();

  /// Replaces the sink and answers the old one; null stands for the standard one, in both directions. For tests and for
  /// embedding programs. A line that is being written may still reach the old sink.
  static std::shared_ptr<LogSink> setSink(std::shared_ptr<LogSink> sink);
  /// Reads a level text as EXTORA_LOG has it: "debug" or per category "ops=debug,ar=info"; what it does not name is at
  /// "default". Unknown words are ignored. Replaces what was set before. Called once by itself with the environment's
  /// EXTORA_LOG before the first line.
  static void configure(std::string_view levels);
  /// Whether this build of the platform has internal diagnostics (EXTORA_INTERNAL_DIAGNOSTICS=1); asked once.
  static bool hasInternalDiagnostics();
  /// Writes out whatever the sink may hold back; called before the process ends.
  static void flush();

  const std::string& subsystem() const noexcept { return subsystem_; }
  const std::string& category() const noexcept { return category_; }
  bool enabled(LogLevel level) const noexcept {
    return static_cast<int>(level) >= threshold_.load(std::memory_order_relaxed);
  }

  template <typename... Args>
  void debug(fmt::format_string<Args...> format, Args&&... args) const {
    log(LogLevel::Debug, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void info(fmt::format_string<Args...> format, Args&&... args) const {
    log(LogLevel::Info, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void def(fmt::format_string<Args...> format, Args&&... args) const {
    log(LogLevel::Default, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void error(fmt::format_string<Args...> format, Args&&... args) const {
    log(LogLevel::Error, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void fault(fmt::format_string<Args...> format, Args&&... args) const {
    log(LogLevel::Fault, format, std::forward<Args>(args)...);
  }
  template <typename... Args>
  void log(LogLevel level, fmt::format_string<Args...> format, Args&&... args) const {
    if (enabled(level)) write(level, fmt::vformat(format, fmt::make_format_args(args...)));
  }

  /// Writes a line that is ready, whatever its level.
  void write(LogLevel level, std::string_view message) const;

 private:
  struct Registry;
  Log(std::string subsystem, std::string category, int threshold);

  const std::string subsystem_;
  const std::string category_;
  std::atomic<int> threshold_;
};

/// Replaces the bytes of control characters, and bytes that are not UTF-8, by \xNN: for text that goes to a terminal or
/// into one log line.
std::string escapeControlCharacters(std::string_view text);

}  // namespace platform
