#include "platform/log/Log.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <map>
#include <optional>
#include <utility>

#include "platform/log/StandardLogSink.h"
#include "platform/queue/Mutex.h"
#include "platform/value/Utf8.h"

namespace platform {
namespace {

constexpr std::array<std::pair<std::string_view, LogLevel>, 5> kLevelWords = {{{"debug", LogLevel::Debug},
                                                                               {"info", LogLevel::Info},
                                                                               {"default", LogLevel::Default},
                                                                               {"error", LogLevel::Error},
                                                                               {"fault", LogLevel::Fault}}};

std::optional<LogLevel> levelOf(std::string_view word) {
  const auto found =
      std::find_if(kLevelWords.begin(), kLevelWords.end(), [&](auto& known) { return known.first == word; });
  return found == kLevelWords.end() ? std::nullopt : std::optional(found->second);
}

std::string_view trimmed(std::string_view text) {
  while (!text.empty() && text.front() == ' ') text.remove_prefix(1);
  while (!text.empty() && text.back() == ' ') text.remove_suffix(1);
  return text;
}

bool isCategoryName(std::string_view name) {
  return !name.empty() &&
         std::all_of(name.begin(), name.end(), [](char c) { return c > ' ' && c < 0x7F && c != '=' && c != ','; });
}

const char* environment(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? "" : value;
}

// The levels that were asked for.
struct Levels {
  LogLevel overall = LogLevel::Default;
  std::map<std::string, LogLevel, std::less<>> categories;

  explicit Levels(std::string_view text) {
    while (!text.empty()) {
      const std::size_t comma = std::min(text.find(','), text.size());
      const std::string_view part = text.substr(0, comma);
      text.remove_prefix(std::min(comma + 1, text.size()));
      const std::size_t equals = part.find('=');
      const auto level = levelOf(trimmed(equals == std::string_view::npos ? part : part.substr(equals + 1)));
      if (!level) continue;
      if (equals == std::string_view::npos) {
        overall = *level;
      } else {
        categories[std::string(trimmed(part.substr(0, equals)))] = *level;
      }
    }
  }

  int of(std::string_view category) const {
    const auto found = categories.find(category);
    return static_cast<int>(found == categories.end() ? overall : found->second);
  }
};

}  // namespace

// The handles, levels and sink of the process.
struct Log::Registry {
  Mutex mutex;
  Levels levels XT_GUARDED_BY(mutex){environment("EXTORA_LOG")};
  std::map<std::pair<std::string, std::string>, std::unique_ptr<Log>> named XT_GUARDED_BY(mutex);

  const std::shared_ptr<LogSink> standard =
      std::make_shared<StandardLogSink>(STDERR_FILENO, environment("JOURNAL_STREAM"));
  Mutex sinkMutex;
  std::shared_ptr<LogSink> replaced XT_GUARDED_BY(sinkMutex);  // null: the standard one

  // Never released: lines may come while the process ends.
  static Registry& shared() {
    static auto* const registry = new Registry;
    return *registry;
  }

  const Log* handle(std::string_view subsystem, std::string_view category) XT_EXCLUDES(mutex) {
    const MutexLock lock(mutex);
    std::unique_ptr<Log>& log = named[{std::string(subsystem), std::string(category)}];
    if (log == nullptr) log.reset(new Log(std::string(subsystem), std::string(category), levels.of(category)));
    return log.get();
  }

  std::shared_ptr<LogSink> sink() XT_EXCLUDES(sinkMutex) {
    const MutexLock lock(sinkMutex);
    return replaced != nullptr ? replaced : standard;
  }

  int level(std::string_view category) XT_EXCLUDES(mutex) {
    const MutexLock lock(mutex);
    return levels.of(category);
  }
};

Log::Log(std::string subsystem, std::string category, int threshold)
    : subsystem_(std::move(subsystem)), category_(std::move(category)), threshold_(threshold) {}

Log::Log(std::string subsystem, std::string category)
    : Log(std::move(subsystem), category, Registry::shared().level(category)) {}

const Log* Log::named(std::string_view subsystem, std::string_view category) {
  return isCategoryName(category) ? Registry::shared().handle(subsystem, category) : nullptr;
}

const Log& Log::processDefault() {
  static const Log* const log = Registry::shared().handle("", "-");
  return *log;
}

std::shared_ptr<LogSink> Log::setSink(std::shared_ptr<LogSink> sink) {
  Registry& registry = Registry::shared();
  const MutexLock lock(registry.sinkMutex);
  return std::exchange(registry.replaced, std::move(sink));
}

void Log::configure(std::string_view levels) {
  Registry& registry = Registry::shared();
  const MutexLock lock(registry.mutex);
  registry.levels = Levels(levels);
  for (const auto& [name, log] : registry.named) {
    log->threshold_.store(registry.levels.of(name.second), std::memory_order_relaxed);
  }
}

bool Log::hasInternalDiagnostics() {
  static const bool has = std::string_view(environment("EXTORA_INTERNAL_DIAGNOSTICS")) == "1";
  return has;
}

void Log::flush() {
  Registry::shared().sink()->flush();
}

void Log::write(LogLevel level, std::string_view message) const {
  Registry::shared().sink()->write(subsystem_, category_, level, message);
}

std::string escapeControlCharacters(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const auto lead = static_cast<unsigned char>(text[i]);
    const std::size_t length = lead < 0x80 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
    const std::string_view character = text.substr(i, length);
    // Beside those of ASCII: U+0080 to U+009F, which terminals obey, and bytes that are no UTF-8.
    const bool plain = lead < 0x80
                           ? lead >= 0x20 && lead != 0x7F
                           : isUtf8(character) && !(lead == 0xC2 && static_cast<unsigned char>(character[1]) < 0xA0);
    if (plain) {
      out += character;
      i += length;
    } else {
      out += fmt::format("\\x{:02x}", lead);
      ++i;
    }
  }
  return out;
}

}  // namespace platform
