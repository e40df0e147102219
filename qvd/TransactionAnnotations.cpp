// The "annotate" and "bulk-annotate" requests, and the annotations a plug-in
// form carries. Changes are saved one plug-in at a time; a request that
// stops part-way keeps what it already changed and posts no notification,
// so observers only hear of requests that completed.
#include <string>
#include <utility>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "platform/values/Uuid.h"
#include "qvd/QVDAnnotationConstants.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"

namespace qvd {

namespace {

std::string uuidText(const QVDPlugIn& plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn.uuid();
  return uuid ? uuid->toString() : std::string("(none)");
}

// Only the two entries a client may set survive; anything else in the
// request is dropped without complaint, as older clients send extra keys.
enum class FilterOutcome { Filtered, BadElection, BadExtension };

FilterOutcome filterAnnotation(const platform::Dictionary& requested, platform::Dictionary& kept) {
  if (const platform::Value* election = requested.find(QVAnnotationElectionKey)) {
    if (!election->isNumber()) return FilterOutcome::BadElection;
    kept.set(QVAnnotationElectionKey, *election);
  }
  if (const platform::Value* extension = requested.find(QVAnnotationExtensionKey)) {
    if (extension->dictionary() == nullptr) return FilterOutcome::BadExtension;
    kept.set(QVAnnotationExtensionKey, *extension);
  }
  return FilterOutcome::Filtered;
}

}  // namespace

void Transaction::annotatePlugIns() {
  const platform::Dictionary* requested = request_.get(QVDAnnotationsKey).dictionary();
  if (requested == nullptr) {
    failMessage(QVErrorInvalidRequest, "invalid request format (bad annotations dictionary)");
    return;
  }
  platform::Dictionary annotation;
  switch (filterAnnotation(*requested, annotation)) {
    case FilterOutcome::BadElection:
      failMessage(QVErrorInvalidRequest, "invalid request format (annotation election)");
      return;
    case FilterOutcome::BadExtension:
      failMessage(QVErrorInvalidRequest, "invalid request format (annotation extension)");
      return;
    case FilterOutcome::Filtered:
      break;
  }
  // Nothing to change: not even the plug-in list is looked at.
  if (annotation.empty()) {
    done();
    return;
  }
  const int pid = client_->pid();
  const platform::Value shown(annotation);
  const bool completed = processUuidList([&](const std::shared_ptr<const QVDPlugIn>& plugIn) {
    const std::string identifier = plugIn->identifier().value_or("");
    const std::string uuid = uuidText(*plugIn);
    QVLogOps().debug("client %d plug-in %{public}@(%{public}@) annotation change: %@", pid,
                     identifier, uuid, shown);
    if (const platform::Value* election = annotation.find(QVAnnotationElectionKey)) {
      QVLogOps().info("client %d plug-in %{public}@(%{public}@) election := %@", pid, identifier,
                      uuid, *election);
    }
    server()->setAnnotationForPlugIn(annotation, *plugIn);
    return true;
  });
  if (!completed) return;  // processUuidList has failed the request
  server()->notifyAnnotationChange();
  done();
}

void Transaction::bulkAnnotatePlugIns() {
  const platform::Dictionary* requested = request_.get(QVDAnnotationsKey).dictionary();
  if (requested == nullptr) {
    failMessage(QVErrorInvalidRequest, "invalid request format (bad annotations dictionary)");
    return;
  }
  QVLogOps().debug("bulk change requested for %u plug-ins",
                   static_cast<unsigned>(requested->size()));
  const int pid = client_->pid();
  for (const auto& [key, value] : *requested) {
    if (value.dictionary() == nullptr) {
      failMessage(QVErrorInvalidValue, "annotations values must be dictionaries");
      return;
    }
    const std::optional<platform::Uuid> uuid = platform::Uuid::parse(key);
    if (!uuid) {
      failMessage(QVErrorInvalidValue, "invalid plug-in UUID value");
      return;
    }
    const std::shared_ptr<QVDPlugIn> plugIn = server()->findPlugIn(*uuid);
    if (!plugIn) {
      failMessage(QVErrorRegistryFailure, "no plug-in with the requested uuid");
      return;
    }
    QVLogOps().debug("client %d bulk plug-in %{public}@(%{public}@) annotation change: %@", pid,
                     plugIn->identifier().value_or(""), uuidText(*plugIn), value);
    // The election is the user's alone: a bulk change replaces the
    // extension data whole and leaves the election as it is.
    server()->setAnnotationForPlugIn(platform::Dictionary{{std::string(QVAnnotationExtensionKey), value}},
                                     *plugIn);
  }
  server()->notifyAnnotationChange();
  done();
}

bool Transaction::pluginShouldBeAutoEnabled(const QVDPlugIn& /*plugIn*/) const { return false; }

void Transaction::addAnnotationForPlugIn(const QVDPlugIn& plugIn, platform::Dictionary& form) const {
  std::optional<platform::Dictionary> annotation = server()->annotationForPlugIn(plugIn);
  if (!annotation) {
    annotation = pluginShouldBeAutoEnabled(plugIn)
                     ? platform::Dictionary{{std::string(QVAnnotationElectionKey), 1}}
                     : platform::Dictionary();
  }
  form.set(QVAnnotationsFormKey, std::move(*annotation));
}

}  // namespace qvd
