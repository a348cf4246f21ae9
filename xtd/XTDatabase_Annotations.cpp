// The database's operations on annotations and elections.
#include "Extora/XTUtilities.h"
#include "Extora/XTVocabulary.h"
#include "xtd/ElectionFilter.h"
#include "xtd/XTDatabase.h"

namespace extora {

Value XTDatabase::annotationForPlugIn(const XTDPlugIn& plugIn) {
  return sync_.sync([&] {
    sync_.assertOnQueue();
    return annotations_->annotationForPlugIn(plugIn);
  });
}

void XTDatabase::setAnnotation(const Value& annotation, const XTDPlugIn& plugIn) {
  sync_.sync([&] {
    sync_.assertOnQueue();
    annotations_->setAnnotation(annotation, plugIn);
  });
}

void XTDatabase::notifyAnnotationChange() {
  platform_->notifications->postNotification(std::string(XTNotifyAnnotationChange));
}

void XTDatabase::autoElect(const XTDPlugIn& plugIn) {
  sync_.assertOnQueue();
  const Dictionary annotation(annotations_->annotationForPlugIn(plugIn));
  if (electionBits(annotation[XTAnnotationElectionKey]) != 0) return;
  annotations_->setAnnotation(dictionaryChanging(annotation, XTAnnotationElectionKey, 1), plugIn);
}

}  // namespace extora
