#include "qvd/QVDPlugInHold.h"

#include <utility>

namespace qvd {

namespace {

QVDBlockedSet blockedSetOf(const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns) {
  QVDBlockedSet blocked;
  for (const auto& plugIn : plugIns) {
    if (plugIn) blocked.insert(plugIn);
  }
  return blocked;
}

}  // namespace

QVDPlugInHold::QVDPlugInHold(platform::Uuid uuid,
                             const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns,
                             std::weak_ptr<QVDMbxClient> client)
    : uuid_(uuid),
      blocked_(blockedSetOf(plugIns)),
      client_(std::move(client)),
      created_(platform::Date::now()) {}

std::shared_ptr<const QVDPlugInHold> QVDPlugInHold::initWithPlugInsForClient(
    const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns,
    std::weak_ptr<QVDMbxClient> client) {
  return std::make_shared<const QVDPlugInHold>(platform::Uuid::generate(), plugIns,
                                               std::move(client));
}

}  // namespace qvd
