// "annotate" and "bulk-annotate". What was changed before a failing entry stays changed; only a walk that reached its
// end is announced.
#include <fmt/format.h>

#include "Extora/XTLog.h"
#include "Extora/XTVocabulary.h"
#include "platform/value/PropertyListKinds.h"
#include "xtd/Transaction.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {

void Transaction::annotatePlugIns() {
  const Value& sent = request()[XTDAnnotationsKey];
  if (!sent.isDictionary()) return fail(XTErrorRequest, "invalid request format (bad annotations dictionary)");
  const Value& election = sent[XTAnnotationElectionKey];
  if (election && !election.isNumber()) return fail(XTErrorRequest, "invalid request format (annotation election)");
  const Value& extension = sent[XTAnnotationExtensionKey];
  if (extension && !extension.isDictionary()) {
    return fail(XTErrorRequest, "invalid request format (annotation extension)");
  }
  const Value annotation = platform::toPropertyListKinds(
      Dictionary{{XTAnnotationElectionKey, election}, {XTAnnotationExtensionKey, extension}});
  if (annotation.size() == 0) return done();

  const bool walked = processUuidList([&](const std::shared_ptr<XTDPlugIn>& plugIn) {
    XTLogOps().debug("client {} plug-in {}({}) annotation change: {}", client_->pid(), plugIn->identifier(),
                     plugIn->uuid(), annotation);
    if (const Value& chosen = annotation[XTAnnotationElectionKey]) {
      XTLogOps().info("client {} plug-in {}({}) election := {}", client_->pid(), plugIn->identifier(), plugIn->uuid(),
                      chosen);
    }
    server().setAnnotation(annotation, *plugIn);
    return true;
  });
  if (!walked) return;
  server().notifyAnnotationChange();
  done();
}

void Transaction::bulkAnnotatePlugIns() {
  const Value& sent = request()[XTDAnnotationsKey];
  if (!sent.isDictionary()) return fail(XTErrorRequest, "invalid request format (bad annotations dictionary)");
  XTLogOps().debug("bulk change requested for {} plug-ins", sent.size());
  for (const auto& [key, value] : sent.entries()) {
    if (!value.isDictionary()) return fail(XTErrorAnnotation, "annotations values must be dictionaries");
    const std::optional<Uuid> uuid = Uuid::parse(key);
    if (!uuid) return fail(XTErrorAnnotation, "invalid plug-in UUID value");
    const std::shared_ptr<XTDPlugIn> plugIn = server().findPlugIn(*uuid);
    if (!plugIn) return fail(XTErrorRegistry, "no plug-in with the requested uuid");
    const Value extension = platform::toPropertyListKinds(value);
    XTLogOps().debug("client {} bulk plug-in {}({}) annotation change: {}", client_->pid(), plugIn->identifier(),
                     plugIn->uuid(), extension);
    server().setAnnotation(Dictionary{{XTAnnotationExtensionKey, extension}}, *plugIn);
  }
  server().notifyAnnotationChange();
  done();
}

}  // namespace extora
