// The "find" request: one plug-in, named by UUID or by bundle URL, answered
// with its form. None of the match request's gates apply: a host may look
// up a plug-in that is held, excluded or not elected.
#include <string>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"
#include "qvd/WireValues.h"

namespace qvd {

std::shared_ptr<QVDPlugIn> Transaction::findPlugInByUUID(const platform::Value& wireUuid) const {
  const std::optional<platform::Uuid> uuid = wireUuid.uuid();
  if (!uuid) return nullptr;
  return server()->findPlugIn(*uuid);
}

std::shared_ptr<QVDPlugIn> Transaction::findPlugInByPathURL(const platform::Value& wireUrl) const {
  const std::string* url = wire::text(wireUrl);
  if (url == nullptr) return nullptr;
  return server()->findPlugInAtPath(*url);
}

void Transaction::findPlugIn() {
  // A key of the wrong wire type counts as absent; a usable path decides
  // over the UUID, whatever the UUID found.
  std::shared_ptr<QVDPlugIn> plugIn;
  if (const platform::Value& uuid = request_.get(QVDUUIDKey); uuid.uuid()) {
    plugIn = findPlugInByUUID(uuid);
  }
  if (const platform::Value& path = request_.get(QVDPathsKey); wire::text(path) != nullptr) {
    plugIn = findPlugInByPathURL(path);
  }
  if (!plugIn) {
    QVLogOps().notice("plugin not found");
    failMessage(QVErrorNotFound, "Cannot locate PlugIn");
    return;
  }
  QVLogOps().notice("plugin found %{public}@", *plugIn);

  std::optional<platform::Error> error;
  std::optional<platform::Dictionary> form = plugIn->exportForm(&error);
  if (!form) {
    const std::optional<platform::Uuid> uuid = plugIn->uuid();
    QVLogOps().error("failed to export matching plug-in %{public}@: %{public}@",
                     uuid ? uuid->toString() : std::string("(none)"),
                     error ? error->description() : std::string("unknown error"));
    done();
    return;
  }
  addAnnotationForPlugIn(*plugIn, *form);
  plugIn->augmentForm(*form);
  std::optional<platform::cbor::EncodedValue> matches =
      QVDaemonClient::convertToMBX(platform::Value(std::move(*form)), version());
  // A version-2 request gets no form: its whole-value encoding is not
  // defined, and the request still succeeds.
  if (matches) setReplyEncoded(std::string(QVDMatchesKey), std::move(*matches));
  done();
}

}  // namespace qvd
