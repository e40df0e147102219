// The database's annotation operations. Every read and change goes through
// the database queue, so a request's changes are applied and saved one at a
// time, whichever queue the request runs on.
#include <utility>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDatabase.h"

namespace qvd {

std::optional<platform::Dictionary> QVDatabase::annotationForPlugIn(const QVDPlugIn& plugIn) const {
  std::optional<platform::Dictionary> annotation;
  sync_->sync([&] { annotation = annotations_->annotationForPlugIn(plugIn); });
  return annotation;
}

void QVDatabase::setAnnotationForPlugIn(std::optional<platform::Dictionary> annotation,
                                        const QVDPlugIn& plugIn) {
  sync_->sync([&] { annotations_->setAnnotationForPlugIn(std::move(annotation), plugIn); });
}

void QVDatabase::notifyAnnotationChange() const {
  if (platform::Status posted = notifications_->post(QVNotifyAnnotationChange); !posted.ok()) {
    QVLogOps().error("cannot post %{public}s: %@", std::string(QVNotifyAnnotationChange),
                     posted.error());
  }
}

}  // namespace qvd
