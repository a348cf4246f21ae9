#include "platform/consent/ConsentService.h"

#include <sys/stat.h>

#include <utility>

#include "platform/files/DamagedFileLog.h"
#include "platform/files/FileState.h"
#include "platform/files/Files.h"
#include "platform/files/ReadFile.h"
#include "platform/plist/PropertyList.h"

namespace platform {
namespace {

constexpr std::size_t kMaxConsentBytes = std::size_t{16} << 20;

class FileConsentService : public ConsentService {
 public:
  explicit FileConsentService(std::string path) : path_(std::move(path)) {}

  std::optional<std::vector<ConsentRecord>> consentInfoForBundle(const PlatformBundle& bundle) override {
    const Value identifier = bundle.info()["HBBundleIdentifier"];
    const Value consents = read();
    if (!identifier.isString() || !consents.isDictionary()) return std::nullopt;
    std::vector<ConsentRecord> records;
    for (const auto& [service, granted] : consents[identifier.string()].entries()) {
      records.push_back({service, granted.isBoolean() ? std::optional(granted.exactBoolean()) : std::nullopt});
    }
    return records;
  }

 private:
  // A dictionary; nothing without a file, or with one that cannot be used.
  Value read() const {
    Error error;
    FileState state;
    std::optional<Bytes> bytes;
    if (const UniqueFd fd = openForReading(path_, &error)) {
      struct stat status {};
      if (::fstat(fd.get(), &status) == 0) state = FileState::of(status);
      bytes = readOpenFile(fd.get(), path_, kMaxConsentBytes, &error);
    } else if (error.code == kFileDoesNotExist) {
      return {};
    }
    Value content = bytes ? parsePropertyList(*bytes, &error) : Value();
    if (content.isDictionary()) return content;
    DamagedFileLog::shared().report(path_, state, content ? "it is not a dictionary" : error.describe());
    return {};
  }

  const std::string path_;
};

}  // namespace

std::shared_ptr<ConsentService> ConsentService::make(const Directories& directories) {
  return std::make_shared<FileConsentService>(directories.state + "/consent.plist");
}

}  // namespace platform
