#include "platform/locale/Locale.h"

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string_view>
#include <utility>

#include "platform/files/DamagedFileLog.h"
#include "platform/files/Files.h"
#include "platform/files/ReadFile.h"
#include "platform/log/Log.h"
#include "platform/queue/MainRunLoop.h"
#include "platform/queue/Mutex.h"

namespace platform {
namespace {

constexpr std::size_t kMaxFileBytes = std::size_t{64} << 10;
constexpr std::uint32_t kAppearance = IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr std::uint32_t kFolderEvents = kAppearance | IN_MOVED_FROM | IN_DELETE | IN_CLOSE_WRITE;
constexpr std::uint32_t kFileEvents = IN_CLOSE_WRITE | IN_ATTRIB | IN_DELETE_SELF | IN_MOVE_SELF;

std::string_view trimmed(std::string_view text) {
  constexpr std::string_view kSpace = " \t\r";
  const std::size_t first = text.find_first_not_of(kSpace);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kSpace) - first + 1);
}

// The value of the last LANG of a file of NAME=value lines; empty when it has none.
std::string langOf(std::string_view content) {
  constexpr std::string_view kName = "LANG=";
  std::string_view lang;
  while (!content.empty()) {
    const std::size_t end = std::min(content.find('\n'), content.size());
    const std::string_view line = trimmed(content.substr(0, end));
    content.remove_prefix(std::min(end + 1, content.size()));
    if (!line.starts_with(kName)) continue;
    lang = trimmed(line.substr(kName.size()));
    const bool quoted =
        lang.size() >= 2 && (lang.front() == '"' || lang.front() == '\'') && lang.back() == lang.front();
    if (quoted) lang = lang.substr(1, lang.size() - 2);
  }
  return std::string(lang);
}

class FileLocale : public Locale, public std::enable_shared_from_this<FileLocale> {
 public:
  explicit FileLocale(std::string folder) : folder_(std::move(folder)), file_(folder_ + "/locale.conf") {
    const MutexLock lock(mutex_);
    current_ = effective();
  }

  std::string current() override {
    const MutexLock lock(mutex_);
    return current_;
  }

  std::unique_ptr<Observation> observe(std::function<void()> handler) override {
    const MutexLock lock(mutex_);
    observers_.emplace_back(++lastObserver_, std::move(handler));
    return std::make_unique<Registration>(weak_from_this(), lastObserver_);
  }

  void startWatching() override {
    if (inotify_) return;
    inotify_.reset(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (!inotify_) {
      Log::processDefault().error("{}", posixError(errno, "cannot watch " + file_));
      return;
    }
    watch();
    source_ = MainRunLoop::main().addFd(inotify_.get(), EPOLLIN, [this](std::uint32_t) { somethingChanged(); });
    // What changed between the construction and now is told as soon as the loop runs.
    MainRunLoop::main().async([weak = weak_from_this()] {
      if (const auto self = weak.lock()) self->look();
    });
  }

 private:
  class Registration : public Observation {
   public:
    Registration(std::weak_ptr<FileLocale> locale, std::uint64_t number)
        : locale_(std::move(locale)), number_(number) {}
    ~Registration() override {
      const auto locale = locale_.lock();
      if (locale == nullptr) return;
      const MutexLock lock(locale->mutex_);
      std::erase_if(locale->observers_, [&](const auto& observer) { return observer.first == number_; });
    }
    Registration(const Registration&) = delete;
    Registration& operator=(const Registration&) = delete;

   private:
    const std::weak_ptr<FileLocale> locale_;
    const std::uint64_t number_;
  };

  std::string effective() const {
    Error error;
    const UniqueFd fd = openForReading(file_, &error);
    const auto bytes = fd ? readOpenFile(fd.get(), file_, kMaxFileBytes, &error) : std::nullopt;
    if (bytes) return langOf({reinterpret_cast<const char*>(bytes->data()), bytes->size()});
    struct stat status {};
    if (error.code != kFileDoesNotExist && ::stat(file_.c_str(), &status) == 0) {
      DamagedFileLog::shared().report(file_, FileState::of(status), error.describe());
    }
    const char* lang = std::getenv("LANG");
    return lang == nullptr ? "" : lang;
  }

  // Watches the folder, or while there is none the nearest one above it, and the file that a link leads to. Watching
  // what is watched already changes nothing.
  void watch() {
    std::string place = folder_;
    int folder = ::inotify_add_watch(inotify_.get(), place.c_str(), kFolderEvents);
    while (folder < 0 && place.size() > 1) {
      place.resize(std::max<std::size_t>(place.rfind('/'), 1));
      folder = ::inotify_add_watch(inotify_.get(), place.c_str(), kAppearance);
    }
    const int before = std::exchange(folderWatch_, folder);
    if (before != folder) {
      if (before >= 0) (void)::inotify_rm_watch(inotify_.get(), before);
      // What is nearer may have come before this watch began.
      if (folder >= 0 && place != folder_) watch();
    }
    (void)::inotify_add_watch(inotify_.get(), file_.c_str(), kFileEvents);
  }

  void somethingChanged() {
    alignas(struct inotify_event) std::array<char, 4096> events{};
    std::uint32_t seen = 0;
    for (ssize_t size = 0; (size = ::read(inotify_.get(), events.data(), events.size())) > 0;) {
      for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
        struct inotify_event event {};
        std::memcpy(&event, events.data() + at, sizeof event);
        seen |= event.mask;
        at += sizeof event + event.len;
      }
    }
    watch();
    // A new file is looked at when its writer has closed it; a new link, or a folder that came with it, is complete.
    struct stat status {};
    const bool justMade = (seen & ~std::uint32_t{IN_CREATE}) == 0 && ::lstat(file_.c_str(), &status) == 0 &&
                          S_ISREG(status.st_mode) && status.st_nlink == 1;
    if (!justMade) look();
  }

  void look() {
    std::string lang = effective();
    std::vector<std::uint64_t> numbers;
    {
      const MutexLock lock(mutex_);
      if (lang == current_) return;
      current_ = std::move(lang);
      for (const auto& observer : observers_) numbers.push_back(observer.first);
    }
    // One by one: a handler may end another's observation.
    for (const std::uint64_t number : numbers) {
      if (const auto handler = handlerOf(number)) handler();
    }
  }

  std::function<void()> handlerOf(std::uint64_t number) {
    const MutexLock lock(mutex_);
    const auto found = std::find_if(observers_.begin(), observers_.end(),
                                    [&](const auto& observer) { return observer.first == number; });
    return found == observers_.end() ? nullptr : found->second;
  }

  const std::string folder_;
  const std::string file_;

  Mutex mutex_;
  std::string current_ XT_GUARDED_BY(mutex_);
  std::vector<std::pair<std::uint64_t, std::function<void()>>> observers_ XT_GUARDED_BY(mutex_);
  std::uint64_t lastObserver_ XT_GUARDED_BY(mutex_) = 0;

  // On the main thread. The source goes before its descriptor.
  UniqueFd inotify_;
  int folderWatch_ = -1;
  std::unique_ptr<MainRunLoop::Source> source_;
};

}  // namespace

std::shared_ptr<Locale> Locale::make(const Directories& directories) {
  return std::make_shared<FileLocale>(directories.config);
}

std::vector<std::string> localizationCandidates(const std::string& lang) {
  const std::string name = lang.substr(0, lang.find_first_of(".@"));
  if (name == "C" || name == "POSIX" || !isPathSafeName(name)) return {};
  const std::string language = name.substr(0, name.find('_'));
  if (language == name) return {name};
  return {name, language};
}

}  // namespace platform
