// XTDAnnotationStore: the annotations of plug-ins, in memory, and the one file that the daemon owns.
//
// The file is read once, at construction; every look-up is answered from memory; every change rewrites the whole file
// atomically. The store has no lock: every use is on the database's queue "XTDatabase".
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "Extora/XTError.h"
#include "platform/Platform.h"
#include "platform/value/Url.h"
#include "platform/value/Value.h"

namespace extora {

class XTDPlugIn;

class XTDAnnotationStore {
 public:
  /// The only version of the file that is accepted.
  static constexpr std::int64_t kVersion = 16;

  /// A store loaded from `databasePath` (or the default location), or migrated, or empty.
  static std::unique_ptr<XTDAnnotationStore> initWithDatabase(std::shared_ptr<platform::Platform> platform,
                                                              const std::optional<std::string>& databasePath);

  /// The annotation dictionary filed under the plug-in's annotation key, or nothing.
  platform::Value annotationForPlugIn(const XTDPlugIn& plugIn) const;
  /// The annotation dictionary filed under exactly `identifier`, or nothing.
  platform::Value annotationForIdentifier(const std::string& identifier) const;
  /// Merges the entries of `annotation` (one level deep) into what is filed for the plug-in, or removes the whole entry
  /// when it is nothing; then saves. A failed save is logged and memory stands.
  void setAnnotation(const platform::Value& annotation, const XTDPlugIn& plugIn);

  /// True when the map was loaded from `url`; on failure memory is as it was and `error` says why.
  [[nodiscard]] bool loadDb(const platform::Url& url, Error* error);
  /// True when the whole map is in the file; on failure the file is as it was and `error` says why.
  [[nodiscard]] bool saveDb(Error* error);

  /// In multi-user mode a file in the daemon's container, in a directory made here; else globalURL. A directory that
  /// cannot be made is a broken contract.
  static platform::Url defaultDatabaseURL(platform::Platform& platform);
  /// The one file of the whole device.
  static platform::Url globalURL(platform::Platform& platform);
  /// The daemon's own container, made when missing; one that cannot be had is a broken contract.
  static platform::Url containerURL(platform::Platform& platform);

  const platform::Url& annotationsURL() const { return annotationsURL_; }
  /// annotation key -> annotation dictionary.
  const platform::Dictionary& annotations() const { return annotations_; }

 private:
  explicit XTDAnnotationStore(std::shared_ptr<platform::Platform> platform);
  // Gives a file that did not load its second name; an error means that it must not be replaced yet.
  std::optional<Error> keepUnloadedFile();

  std::shared_ptr<platform::Platform> platform_;
  platform::Url annotationsURL_;  // constant after construction
  platform::Dictionary annotations_;
  bool unloadedFile_ = false;  // the file did not load and still has its name
};

}  // namespace extora
