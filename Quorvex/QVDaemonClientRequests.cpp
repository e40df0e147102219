// QVDaemonClient: the message of each request. Besides "request" and
// "version", each carries exactly the keys the daemon reads for it.
#include <string>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;

namespace {

Array textArray(const std::vector<std::string>& texts) {
  Array array;
  array.reserve(texts.size());
  for (const std::string& text : texts) array.append(Value(text));
  return array;
}

}  // namespace

Dictionary QVDaemonClient::request(std::string_view name) const {
  Dictionary message;
  message.set(QVDRequestKey, Value(name));
  message.set(QVDVersionKey, Value(protocolVersion()));
  return message;
}

Dictionary QVDaemonClient::request(std::string_view name,
                                   const std::vector<std::string>& paths) const {
  Dictionary message = request(name);
  message.set(QVDPathsKey, textArray(paths));
  return message;
}

void QVDaemonClient::setPlugins(Dictionary& message, const QVDPlugInMap& plugIns) {
  Array uuids;
  Array paths;
  uuids.reserve(plugIns.size());
  paths.reserve(plugIns.size());
  for (const auto& [path, uuid] : plugIns) {
    uuids.append(Value(uuid));
    paths.append(Value(path));
  }
  message.set(QVDUUIDKey, std::move(uuids));
  message.set(QVDPathsKey, std::move(paths));
}

void QVDaemonClient::setUuids(Dictionary& message, const std::vector<Uuid>& uuids) {
  Array array;
  array.reserve(uuids.size());
  for (const Uuid& uuid : uuids) array.append(Value(uuid));
  message.set(QVDUUIDKey, std::move(array));
}

void QVDaemonClient::addPlugIns(const std::vector<std::string>& paths, QVDReplyHandler reply) {
  send(request(QVDAddRequest, paths), std::move(reply));
}

void QVDaemonClient::removePlugIns(const std::vector<std::string>& paths, QVDReplyHandler reply) {
  send(request(QVDRemoveRequest, paths), std::move(reply));
}

void QVDaemonClient::bulkPlugins(std::uint64_t flags, QVDReplyHandler reply) {
  Dictionary message = request(QVDBulkRequest);
  message.set(QVDFlagsKey, Value(flags));
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::readyPlugIns(const QVDPlugInMap& plugIns, QVDSending sending,
                                  std::uint64_t flags, const std::optional<Dictionary>& environment,
                                  QVDReplyHandler reply) {
  Dictionary message = request(QVDReadyRequest);
  message.set(QVDFlagsKey, Value(flags));
  if (environment) message.set(QVDEnvironmentKey, *environment);
  setPlugins(message, plugIns);
  sendSynchronously(sending, std::move(message), std::move(reply));
}

void QVDaemonClient::accessPlugIns(const QVDPlugInMap& plugIns, QVDSending sending,
                                   std::uint64_t flags, QVDReplyHandler reply) {
  Dictionary message = request(QVDAccessRequest);
  message.set(QVDFlagsKey, Value(flags));
  setPlugins(message, plugIns);
  sendSynchronously(sending, std::move(message), std::move(reply));
}

void QVDaemonClient::findPlugInByUUID(const Uuid& uuid, QVDReplyHandler reply) {
  QVLogOps().notice("findPlugInByUUID %{public}@", uuid);
  Dictionary message = request(QVDFindRequest);
  message.set(QVDUUIDKey, Value(uuid));
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::findPlugInByPathURL(std::string_view url, QVDReplyHandler reply) {
  QVLogOps().notice("findPlugInByPathURL %{public}@", url);
  // A plain path is the likely mistake here; the daemon would only answer
  // "no such plug-in", which hides it.
  if (!QVPathFromFileURL(url)) {
    failLater(QVErrorWithCodeFormat(QVErrorBadPath, "not a file URL: %s", url), std::move(reply));
    return;
  }
  Dictionary message = request(QVDFindRequest);
  message.set(QVDPathsKey, Value(url));
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::matchPlugIns(const Dictionary& rules, std::uint64_t flags,
                                  QVDReplyHandler reply) {
  Dictionary message = request(QVDMatchRequest);
  message.set(QVDRulesKey, rules);
  message.set(QVDFlagsKey, Value(flags));
  const QVDSending sending =
      (flags & QVDiscoverSynchronous) != 0 ? QVDSending::Synchronous : QVDSending::Asynchronous;
  sendSynchronously(sending, std::move(message), std::move(reply));
}

void QVDaemonClient::setPluginAnnotations(const std::vector<Uuid>& uuids,
                                          const Dictionary& annotations, QVDReplyHandler reply) {
  Dictionary message = request(QVDAnnotateRequest);
  setUuids(message, uuids);
  message.set(QVDAnnotationsKey, annotations);
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::bulkSetPluginAnnotations(const Dictionary& annotations,
                                              QVDReplyHandler reply) {
  Dictionary message = request(QVDBulkAnnotateRequest);
  message.set(QVDAnnotationsKey, annotations);
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags,
                                 QVDReplyHandler reply) {
  Dictionary message = request(QVDLockdownRequest, paths);
  message.set(QVDFlagsKey, Value(flags));
  send(std::move(message), std::move(reply));
}

void QVDaemonClient::releaseHold(const Uuid& token, QVDReplyHandler reply) {
  Dictionary message = request(QVDLockdownRequest);
  setUuids(message, {token});
  send(std::move(message), std::move(reply));
}
