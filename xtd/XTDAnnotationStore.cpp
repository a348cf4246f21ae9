// How the file is kept:
// 1. It is read once. Whatever does not load (a later version too) is left as it is until the first save.
// 2. That first save gives the old file a second name, <file>.damaged, before the new content takes its place.
// 3. Every save writes the whole map in one step; when it fails, memory stays ahead until a later one succeeds.
#include "xtd/XTDAnnotationStore.h"

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "Extora/XTVocabulary.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/InternalInconsistency.h"
#include "platform/value/PropertyListKinds.h"
#include "xtd/Probes.h"
#include "xtd/XTDPlugIn.h"

namespace extora {
namespace {

constexpr std::string_view kStorageDirectory = "com.orvane.extora/";
constexpr std::string_view kStorageFile = "Annotations";
constexpr std::string_view kDamagedSuffix = ".damaged";

// Where a file cannot have a second name, ever, keeping it must not stand in the way of saving.
bool canNeverLink(std::int64_t code) {
  return code == EPERM || code == EOPNOTSUPP || code == ENOSYS || code == EMLINK || code == ENAMETOOLONG;
}

Url fileURL(const std::string& path) {
  std::error_code failed;  // a working directory that has gone: the path stays as it is
  const std::filesystem::path absolute = std::filesystem::absolute(path, failed);
  return Url::file(failed ? path : absolute.native());
}

}  // namespace

XTDAnnotationStore::XTDAnnotationStore(std::shared_ptr<platform::Platform> platform) : platform_(std::move(platform)) {}

std::unique_ptr<XTDAnnotationStore> XTDAnnotationStore::initWithDatabase(
    std::shared_ptr<platform::Platform> platform, const std::optional<std::string>& databasePath) {
  std::unique_ptr<XTDAnnotationStore> store(new XTDAnnotationStore(std::move(platform)));
  platform::Platform& services = *store->platform_;
  store->annotationsURL_ = databasePath ? fileURL(*databasePath) : defaultDatabaseURL(services);
  const Url& url = store->annotationsURL_;

  Error error;
  if (store->loadDb(url, &error)) return store;
  if (error.code != platform::kFileDoesNotExist) {
    store->unloadedFile_ = true;
    XTLogOps().error("unable to load annotation database:{} error:{} (resetting)", url, error);
  }

  const Url source = services.containers->isMultiUserMode() ? globalURL(services) : containerURL(services);
  if (!store->loadDb(source, &error)) return store;
  XTLogOps().info("migrating shared annotations");
  if (!store->saveDb(&error)) {
    XTLogOps().error("unable to save migrated annotations to {} error:{}", url, error);
  }
  return store;
}

platform::Value XTDAnnotationStore::annotationForPlugIn(const XTDPlugIn& plugIn) const {
  return annotationForIdentifier(plugIn.annotationKey());
}

platform::Value XTDAnnotationStore::annotationForIdentifier(const std::string& identifier) const {
  const Value& annotation = annotations_[identifier];
  return annotation.isDictionary() ? annotation : Value();
}

void XTDAnnotationStore::setAnnotation(const platform::Value& annotation, const XTDPlugIn& plugIn) {
  const std::string key = plugIn.annotationKey();
  if (annotation.isNothing()) {
    annotations_.remove(key);
  } else {
    Dictionary entry(annotations_[key]);
    for (const auto& [name, value] : annotation.entries()) {
      Value kept = platform::toPropertyListKinds(value);
      if (!kept.isNothing()) entry.set(name, std::move(kept));
    }
    annotations_.set(key, std::move(entry));
  }
  Error error;
  if (!saveDb(&error)) XTLogOps().error("unable to save annotations:{} error:{}", annotationsURL_, error);
}

bool XTDAnnotationStore::loadDb(const platform::Url& url, Error* error) {
  Error reason;
  const auto failed = [&] {
    probes::dbLoad(reason.domain, static_cast<std::uint64_t>(reason.code));
    platform::setError(error, std::move(reason));
    return false;
  };
  const std::optional<platform::Bytes> bytes = platform_->files->readFileData(url.path(), &reason);
  if (!bytes) return failed();
  const Value database = platform::parsePropertyList(*bytes, &reason);
  if (database.isNothing()) return failed();
  if (const std::int64_t version = database[XTVersionAnnotationsKey].integerValue(); version != kVersion) {
    reason = makeErrorWithFormat(XTErrorVersion, "found database version {} needed version {}", version, kVersion);
    return failed();
  }
  annotations_ = Dictionary(database[XTDataAnnotationsKey]);
  return true;
}

bool XTDAnnotationStore::saveDb(Error* error) {
  const Dictionary database{{XTVersionAnnotationsKey, kVersion}, {XTDataAnnotationsKey, annotations_}};
  const std::optional<std::string> text = platform::serializeXml(database, error);
  if (!text) return false;
  if (std::optional<Error> failure = keepUnloadedFile()) {
    platform::setError(error, std::move(*failure));
    return false;
  }
  const std::span<const std::uint8_t> bytes(reinterpret_cast<const std::uint8_t*>(text->data()), text->size());
  if (std::optional<Error> failure = platform_->files->writeFileAtomic(annotationsURL_.path(), bytes)) {
    platform::setError(error, std::move(*failure));
    return false;
  }
  unloadedFile_ = false;
  return true;
}

std::optional<Error> XTDAnnotationStore::keepUnloadedFile() {
  if (!unloadedFile_) return std::nullopt;
  const std::string& path = annotationsURL_.path();
  const std::string kept = path + std::string(kDamagedSuffix);
  std::optional<Error> failure = platform_->files->linkFile(path, kept);
  if (!failure || failure->code == platform::kFileDoesNotExist) return std::nullopt;
  if (!canNeverLink(failure->code)) return failure;
  XTLogOps().error("unable to keep annotation database as {} error:{}", kept, *failure);
  return std::nullopt;
}

platform::Url XTDAnnotationStore::defaultDatabaseURL(platform::Platform& platform) {
  if (!platform.containers->isMultiUserMode()) return globalURL(platform);
  const Url directory = containerURL(platform).appending(kStorageDirectory);
  if (const std::optional<Error> error = platform.files->createDirectory(directory.path(), true, 0700)) {
    XTLogOps().error("failed to create storage directory at {} - error={}", directory, *error);
    throw platform::InternalInconsistency(
        fmt::format("unable to create plugin annotations directory:{} error:{}", directory.path(), *error));
  }
  Url result = directory.appending(kStorageFile);
  XTLogOps().debug("annotations are stored at {}", result.path());
  return result;
}

platform::Url XTDAnnotationStore::globalURL(platform::Platform& platform) {
  return Url::file(platform.directories.globalAnnotations);
}

platform::Url XTDAnnotationStore::containerURL(platform::Platform& platform) {
  const std::variant<std::string, std::uint64_t> container = platform.containers->containerCreateOrLookup(
      platform::kDaemonContainerClass, platform::kDaemonContainer, /*option=*/1);
  if (const auto* path = std::get_if<std::string>(&container)) return Url::file(*path);
  const std::uint64_t reported = std::get<std::uint64_t>(container);
  const std::uint64_t error = reported == 0 ? 1 : reported;
  XTLogOps().error("failed to get storage container: error={}", error);
  throw platform::InternalInconsistency(fmt::format("unable to locate user container: error {}", error));
}

}  // namespace extora
