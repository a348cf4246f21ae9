// Locale: the current locale of the device: LANG of <config>/locale.conf, watched; without the file, of the
// environment. A file without LANG says that none is set. current() is for any thread, everything else for the main
// thread.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/files/Directories.h"

namespace platform {

class Locale {
 public:
  /// Ends the observation when destroyed.
  class Observation {
   public:
    virtual ~Observation() = default;
  };

  virtual ~Locale() = default;
  /// The value of LANG, e.g. "de_CH.UTF-8"; empty when none is set.
  virtual std::string current() = 0;
  /// Calls `handler` on the main queue after each change of the current locale, observers in order of registration (the
  /// registry registers first, so that it has a new knowledge UUID before the database is told).
  [[nodiscard]] virtual std::unique_ptr<Observation> observe(std::function<void()> handler) = 0;
  /// Begins to watch the file, on the main run loop: its creation, replacement, change in place and deletion, also of a
  /// file that a link leads to. Without it the locale is as it was at construction. The object must be destroyed on the
  /// main thread afterwards.
  virtual void startWatching() = 0;
  static std::shared_ptr<Locale> make(const Directories& directories);
};

/// The names of localization folders to look into for `lang`, best first: "de_CH.UTF-8" gives {"de_CH", "de"}; "C",
/// "POSIX", empty and what cannot be a part of a path give none.
std::vector<std::string> localizationCandidates(const std::string& lang);

}  // namespace platform
