// A plug-in hold: a token that blocks a set of plug-ins while a privileged
// client replaces them. The server keeps its holds in one list touched only
// on its hold queue.
//
// Thread safety: immutable after creation.
#pragma once

#include <memory>
#include <vector>

#include "platform/values/Uuid.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

class QVDMbxClient;

class QVDPlugInHold {
 public:
  QVDPlugInHold(platform::Uuid token, std::vector<std::shared_ptr<const QVDPlugIn>> plugIns,
                std::weak_ptr<QVDMbxClient> client)
      : token_(token), plugIns_(std::move(plugIns)), client_(std::move(client)) {}

  const platform::Uuid& token() const { return token_; }
  const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns() const { return plugIns_; }
  // The client that took the hold; empty once that client has gone. Weak:
  // a hold must not keep a dead client's objects alive.
  const std::weak_ptr<QVDMbxClient>& client() const { return client_; }
  bool isHeldBy(const QVDMbxClient* client) const {
    auto holder = client_.lock();
    return holder && holder.get() == client;
  }

 private:
  const platform::Uuid token_;
  const std::vector<std::shared_ptr<const QVDPlugIn>> plugIns_;
  const std::weak_ptr<QVDMbxClient> client_;
};

}  // namespace qvd
