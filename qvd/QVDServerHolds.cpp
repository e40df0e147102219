// The server's hold list and the forced termination of plug-in processes.
//
// The list lives on the hold queue ("serverSync"); every operation runs
// there and the caller waits, so a "lock" reply is sent only once its hold
// is in force and a later match sees it. The hold queue calls out to
// nothing but the notification post, so waiting on it cannot deadlock. The
// one operation nobody waits for is the release of a dead client's holds.
#include <cerrno>
#include <string>
#include <utility>

#include "Quorvex/QVLog.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDServer.h"

namespace qvd {

namespace {

// The version the service manager is told: the plug-in's bundle version,
// "1" for a bundle that declares none.
std::string versionText(const platform::holvane::PlugInRecord& record) {
  const std::string* version = record.info.get(platform::holvane::kBundleVersionKey).string();
  return version ? *version : std::string("1");
}

platform::Value recordsDescription(const std::vector<platform::holvane::PlugInRecord>& records) {
  platform::Array shown;
  for (const auto& record : records) {
    shown.append(platform::Value(record.identifier + "(" + record.uuid.toString() + ")"));
  }
  return platform::Value(std::move(shown));
}

}  // namespace

bool QVDServer::holdOnPlugIn(const QVDPlugIn& plugIn) const {
  bool held = false;
  syncQueue_->sync([&] {
    for (const auto& hold : holds_) {
      if (hold->blocks(plugIn)) {
        held = true;
        return;
      }
    }
  });
  return held;
}

void QVDServer::addHold(std::shared_ptr<const QVDPlugInHold> hold) {
  syncQueue_->sync([&] { holds_.push_back(std::move(hold)); });
  notifyAnnotationChange();
}

void QVDServer::unholdToken(const platform::Uuid& token) {
  syncQueue_->sync([&] {
    for (auto it = holds_.begin(); it != holds_.end(); ++it) {
      if ((*it)->uuid() != token) continue;
      QVLogOps().debug("releasing plug-in hold %{public}@ at client's request", token);
      holds_.erase(it);
      notifyAnnotationChange();
      return;
    }
  });
}

void QVDServer::unholdClient(std::shared_ptr<QVDMbxClient> client, std::function<void()> then) {
  syncQueue_->async(
      [self = shared_from_this(), client = std::move(client), then = std::move(then)] {
        const int pid = client->pid();
        // One notification per hold: observers count changes.
        for (auto it = self->holds_.begin(); it != self->holds_.end();) {
          if (!(*it)->isHeldBy(client.get())) {
            ++it;
            continue;
          }
          QVLogOps().debug("releasing plug-in hold %{public}@ for dead client pid %d",
                           (*it)->uuid(), pid);
          it = self->holds_.erase(it);
          self->notifyAnnotationChange();
        }
        if (then) then();
      });
}

std::vector<std::shared_ptr<const QVDPlugInHold>> QVDServer::holds() const {
  std::vector<std::shared_ptr<const QVDPlugInHold>> copy;
  syncQueue_->sync([&] { copy = holds_; });
  return copy;
}

void QVDServer::terminatePlugInsReply(std::vector<platform::holvane::PlugInRecord> records,
                                      std::function<void()> reply) {
  // One pair of queues and one semaphore per call: the replies of one
  // termination never wait behind another's.
  auto killer = platform::dispatch::SerialQueue::create("killer");
  auto waiter = platform::dispatch::SerialQueue::create("killer-waiter");
  auto answered = std::make_shared<platform::dispatch::Semaphore>(0);
  const int count = static_cast<int>(records.size());
  for (const auto& record : records) {
    const std::string version = versionText(record);
    const std::string uuid = record.uuid.toString();
    const std::string bundleIdentifier = record.bundleIdentifier.value_or("");
    QVLogOps().debug("requesting termination for %@(%@) lumend:%@ %@", bundleIdentifier,
                     record.version.value_or(""), version, uuid);
    platform_.serviceManager->removeExternalService(
        bundleIdentifier, version, killer, [killer, answered, uuid](int error) {
          QV_ASSERT_ON_QUEUE(killer);
          if (error == ESRCH) {
            QVLogOps().debug("lumend reported no plug-ins on record for uuid=%@", uuid);
          } else if (error != 0) {
            QVLogOps().error("lumend error attempting to terminate plug-ins: error=%d for uuid=%@",
                             error, uuid);
          } else {
            QVLogOps().info("one or more plug-ins have been terminated for uuid=%@", uuid);
          }
          answered->signal();
        });
  }
  // The wait has a queue of its own: it blocks for as long as the service
  // manager takes, and there is deliberately no time-out.
  waiter->async([waiter, answered, count, reply = std::move(reply)] {
    QV_ASSERT_ON_QUEUE(waiter);
    QVLogOps().debug("waiting for %d termination replies", count);
    for (int i = 0; i < count; ++i) {
      QVLogOps().debug("awaiting termination reply #%d", i);
      answered->wait();
    }
    QVLogOps().debug("sending termination reply");
    reply();
  });
}

void QVDServer::removedPlugIns(const std::vector<platform::holvane::PlugInRecord>& records) {
  terminatePlugInsReply(records, [shown = recordsDescription(records)] {
    QVLogOps().debug("removal complete for %@", shown);
  });
}

}  // namespace qvd
