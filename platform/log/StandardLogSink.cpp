#include "platform/log/StandardLogSink.h"

#include <poll.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>

// The place in this source would be that of every line.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <fmt/chrono.h>
#include <systemd/sd-journal.h>

#include <cerrno>
#include <chrono>

namespace platform {
namespace {

constexpr int kPatienceMs = 1000;

struct LevelName {
  const char* text;
  int priority;  // of syslog
};
constexpr LevelName kLevels[] = {{"DEBUG", 7}, {"INFO", 6}, {"DEFAULT", 5}, {"ERROR", 3}, {"FAULT", 2}};

const LevelName& levelName(LogLevel level) {
  return kLevels[static_cast<int>(level)];
}

std::string bounded(std::string_view message) {
  if (message.size() <= kMaxLogMessage) return escapeControlCharacters(message);
  std::size_t end = kMaxLogMessage;
  while (end > kMaxLogMessage - 3 && (static_cast<unsigned char>(message[end]) & 0xC0U) == 0x80) --end;
  return fmt::format("{} [{} more bytes]", escapeControlCharacters(message.substr(0, end)), message.size() - end);
}

std::string timestamp() {
  const auto now = std::chrono::system_clock::now();
  const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(now.time_since_epoch()).count() % 1000;
  return fmt::format("{:%F %T}.{:03}", fmt::localtime(std::chrono::system_clock::to_time_t(now)), ms);
}

void writeAll(int fd, std::string_view line) {
  while (!line.empty()) {
    const ssize_t written = ::write(fd, line.data(), line.size());
    if (written > 0) {
      line.remove_prefix(static_cast<std::size_t>(written));
    } else if (written < 0 && errno == EAGAIN) {
      struct pollfd ready {
        fd, POLLOUT, 0
      };
      if (::poll(&ready, 1, kPatienceMs) <= 0) return;
    } else if (written == 0 || errno != EINTR) {
      return;
    }
  }
}

}  // namespace

StandardLogSink::StandardLogSink(int fd, std::string_view journalStream)
    : fd_(fd), journal_(isJournal(fd, journalStream)), terminal_(::isatty(fd) == 1) {}

bool StandardLogSink::isJournal(int fd, std::string_view journalStream) {
  struct stat status {};
  return !journalStream.empty() && ::fstat(fd, &status) == 0 &&
         journalStream == fmt::format("{}:{}", status.st_dev, status.st_ino);
}

std::string StandardLogSink::textLine(std::string_view category, LogLevel level, std::string_view message) {
  return fmt::format("{} {}: {}", levelName(level).text, category, bounded(message));
}

std::array<std::string, 4> StandardLogSink::journalFields(std::string_view subsystem, std::string_view category,
                                                          LogLevel level, std::string_view message) {
  return {fmt::format("MESSAGE={}", bounded(message)), fmt::format("PRIORITY={}", levelName(level).priority),
          fmt::format("CATEGORY={}", category), subsystem.empty() ? "" : fmt::format("SUBSYSTEM={}", subsystem)};
}

void StandardLogSink::write(std::string_view subsystem, std::string_view category, LogLevel level,
                            std::string_view message) {
  if (journal_) {
    std::array<std::string, 4> fields = journalFields(subsystem, category, level, message);
    std::array<struct iovec, 4> parts{};
    int count = 0;
    for (std::string& field : fields) {
      if (!field.empty()) parts[static_cast<std::size_t>(count++)] = {field.data(), field.size()};
    }
    if (::sd_journal_sendv(parts.data(), count) == 0) return;
  }
  std::string line = textLine(category, level, message) + "\n";
  if (terminal_) line = fmt::format("{} {} {}", timestamp(), ::getpid(), line);
  writeAll(fd_, line);
}

}  // namespace platform
