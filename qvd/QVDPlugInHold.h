// A plug-in hold: a token that blocks a set of plug-ins while a privileged
// client replaces them. While a hold exists the held plug-ins are left out
// of match results and hosts are refused them. The server keeps its holds
// in one list touched only on its hold queue.
//
// Each hold keeps the daemon alive: it owns a keep-alive transaction of the
// message system from creation to destruction, so an idle-exit policy does
// not end the daemon (and with it the hold) while a client relies on it.
//
// Thread safety: immutable after creation; safe to share across queues.
#pragma once

#include <cstddef>
#include <memory>
#include <unordered_set>
#include <vector>

#include "Quorvex/QVPlugInCore.h"
#include "platform/mbx/KeepAliveTransaction.h"
#include "platform/values/Uuid.h"
#include "platform/values/Value.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

class QVDMbxClient;

// Plug-ins by identity (their UUIDs), looked up by any pointer to one.
struct QVDPlugInIdentityHash : QVPlugInCoreHash {
  using is_transparent = void;
};
struct QVDPlugInIdentityEqual : QVPlugInCoreEqual {
  using is_transparent = void;
};
using QVDBlockedSet = std::unordered_set<std::shared_ptr<const QVDPlugIn>, QVDPlugInIdentityHash,
                                         QVDPlugInIdentityEqual>;

class QVDPlugInHold {
 public:
  // A hold with a fresh random token on `plugIns` (duplicates collapse),
  // taken by `client` now. Opens the hold's keep-alive transaction.
  static std::shared_ptr<const QVDPlugInHold> initWithPlugInsForClient(
      const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns,
      std::weak_ptr<QVDMbxClient> client);

  // The token handed to the client.
  const platform::Uuid& uuid() const { return uuid_; }
  const QVDBlockedSet& blocked() const { return blocked_; }
  // The client that took the hold; empty once that client has gone. Weak:
  // a hold must not keep a dead client's objects alive.
  const std::weak_ptr<QVDMbxClient>& client() const { return client_; }
  const platform::Date& created() const { return created_; }

  // Whether `plugIn` is among the blocked plug-ins (by UUID).
  bool blocks(const QVDPlugIn& plugIn) const { return blocked_.contains(&plugIn); }
  bool isHeldBy(const QVDMbxClient* client) const {
    auto holder = client_.lock();
    return holder && holder.get() == client;
  }

  // Holds are equal when their tokens are.
  bool operator==(const QVDPlugInHold& other) const { return uuid_ == other.uuid_; }
  std::size_t hash() const { return platform::UuidHash()(uuid_); }

  // A hold with the token `uuid`, made now. Outside tests, use
  // initWithPlugInsForClient(), which draws a fresh token.
  QVDPlugInHold(platform::Uuid uuid, const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns,
                std::weak_ptr<QVDMbxClient> client);

 private:
  const platform::Uuid uuid_;
  const QVDBlockedSet blocked_;
  const std::weak_ptr<QVDMbxClient> client_;
  const platform::Date created_;
  platform::mbx::KeepAliveTransaction keepAlive_;
};

}  // namespace qvd
