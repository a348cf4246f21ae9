// LogCapture: collects the log lines of the process while it lives, then restores the standard sink and levels.
#pragma once

#include <array>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/log/Log.h"
#include "platform/queue/Mutex.h"

namespace tests {

class LogCapture {
 public:
  /// `levels` as EXTORA_LOG has them.
  explicit LogCapture(const char* levels = "default") {
    platform::Log::configure(levels);
    platform::Log::setSink(sink_);
  }
  ~LogCapture() {
    platform::Log::setSink(nullptr);
    platform::Log::configure("default");
  }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  /// The lines since the last call, each "LEVEL category: message".
  std::vector<std::string> take() { return sink_->take(); }

 private:
  class Sink : public platform::LogSink {
   public:
    void write(std::string_view, std::string_view category, platform::LogLevel level,
               std::string_view message) override {
      constexpr std::array kWords = {"DEBUG", "INFO", "DEFAULT", "ERROR", "FAULT"};
      const platform::MutexLock lock(mutex_);
      lines_.push_back(fmt::format("{} {}: {}", kWords.at(static_cast<std::size_t>(level)), category, message));
    }
    std::vector<std::string> take() {
      const platform::MutexLock lock(mutex_);
      return std::exchange(lines_, {});
    }

   private:
    platform::Mutex mutex_;
    std::vector<std::string> lines_ XT_GUARDED_BY(mutex_);
  };

  const std::shared_ptr<Sink> sink_ = std::make_shared<Sink>();
};

}  // namespace tests
