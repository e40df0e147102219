// The "match" request: discovery. Candidates come from the registry, each
// is filtered on the request's queue, the survivors are exported in
// parallel, and their forms are merged one at a time on a serial queue of
// the request's own before the reply is written.
#include <algorithm>
#include <atomic>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/Group.h"
#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/Semaphore.h"
#include "qvd/HostRelativeDuplicates.h"
#include "qvd/MatchResults.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDProbes.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"
#include "qvd/WireValues.h"

namespace qvd {

namespace {

// Plug-ins per export work item.
constexpr std::size_t kExportBatch = 16;

std::string uuidText(const QVDPlugIn& plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn.uuid();
  return uuid ? uuid->toString() : std::string("(none)");
}

void logCandidates(const std::vector<std::shared_ptr<QVDPlugIn>>& candidates) {
  if (candidates.empty()) {
    QVLogOps().info("Candidate plugin count: 0");
    return;
  }
  if (!QVLogOps().isEnabled(platform::log::Level::Info)) return;
  platform::Array info;
  for (const auto& p : candidates) {
    info.append(p->identifier().value_or("") + "(" + versionText(*p) + ") " + uuidText(*p));
  }
  QVLogOps().info("Candidate plugin count: %u, info: %{public}@",
                  static_cast<unsigned>(candidates.size()), platform::Value(std::move(info)));
}

}  // namespace

void Transaction::matchPlugIns() {
  const platform::Value& rulesValue = request_.get(QVDRulesKey);
  std::optional<platform::Dictionary> rules;
  if (!rulesValue.isNone()) {
    const platform::Dictionary* given = rulesValue.dictionary();
    if (given == nullptr) {
      failMessage(QVErrorInvalidRequest, "invalid request format (bad rules dictionary)");
      return;
    }
    rules = *given;
  }
  const std::uint64_t flags = wire::uint64(request_.get(QVDFlagsKey)).value_or(0);
  const bool all = (flags & QVDiscoverAll) != 0;
  if (all && (!client_->hasEntitlement(QVManagerEntitlement) || client_->isSandboxed())) {
    failMessage(QVErrorDenied, "unauthorized discovery flag (QVDiscoverAll)");
    return;
  }

  auto results = std::make_shared<MatchResults>(flags, shared_from_this());
  const std::shared_ptr<platform::dispatch::Group> exports = platform::dispatch::Group::create();
  const std::vector<platform::Dictionary> exclusions = server()->userPrefs().exclusionRuleSets();

  std::vector<std::shared_ptr<QVDPlugIn>> candidates;
  // Kept until every export has finished: the exports read these records
  // instead of fetching their own.
  QVDLentRecords records;
  if (std::optional<QVDPlugInSet> found = server()->findPlugIns(rules, &records)) {
    candidates.assign(found->begin(), found->end());
  }
  probes::discoverRaw(static_cast<unsigned>(candidates.size()));
  logCandidates(candidates);
  removeHostRelativeDuplicates(candidates, connection());

  const int pid = client_->pid();
  // Read once: every lookup re-reads the grants, and the host's do not
  // change in the middle of its request.
  const platform::Dictionary hostEntitlements =
      all ? platform::Dictionary() : client_->entitlements();
  const std::optional<std::string> hostPlugIns =
      client_->bundle() ? client_->bundle()->plugInsPath() : std::nullopt;
  const auto exportQueue =
      platform::dispatch::ConcurrentQueue::shared(platform::dispatch::Priority::UserInitiated);
  const auto exportSlots = std::make_shared<platform::dispatch::Semaphore>(
      static_cast<std::int64_t>(std::max(2u, 2 * std::thread::hardware_concurrency())));
  // Accepted plug-ins go out in small batches: one export work item and
  // one merge per batch rather than per plug-in, because waking a pool
  // thread twice per plug-in cost more than exporting most of them.
  std::vector<std::shared_ptr<QVDPlugIn>> batch;
  const auto exportBatch = [&](std::vector<std::shared_ptr<QVDPlugIn>> plugIns) {
    // Exports wait on the registry's and the database's queues, which need
    // pool threads of their own: with thousands in flight at once, every
    // pool thread would wait on work that no thread is left to run. A few
    // per core keep both cores busy.
    {
      platform::dispatch::ScopedBlockingCall blocking;
      exportSlots->wait();
    }
    exportQueue->async([plugIns = std::move(plugIns), results, exports, exportSlots] {
      std::vector<std::pair<std::shared_ptr<QVDPlugIn>, platform::Dictionary>> forms;
      forms.reserve(plugIns.size());
      for (const std::shared_ptr<QVDPlugIn>& p : plugIns) {
        std::optional<platform::Error> error;
        std::optional<platform::Dictionary> form = p->exportForm(&error);
        if (!form) {
          QVLogOps().error("failed to export matching plug-in %{public}@: %{public}@", uuidText(*p),
                           error ? error->description() : std::string("unknown error"));
          exports->leave();
          continue;
        }
        forms.emplace_back(p, std::move(*form));
      }
      exportSlots->signal();
      if (forms.empty()) return;
      results->postExportQueue()->async([results, exports, forms = std::move(forms)]() mutable {
        for (auto& [p, form] : forms) {
          results->merge(*p, std::move(form));
          exports->leave();
        }
      });
    });
  };
  for (const std::shared_ptr<QVDPlugIn>& p : candidates) {
    if (!all) {
      if (!p->onSystemVolume()) {
        // Off the system volume a plug-in must belong to an application.
        if (!p->containingUrl()) continue;
        if (flags & QVDiscoverSystemOnly) continue;
      }
      if (p->isDedicated()) {
        const std::string path = p->path().value_or("");
        if (!hostPlugIns || path.compare(0, hostPlugIns->size(), *hostPlugIns) != 0) continue;
      }
      if (server()->holdOnPlugIn(*p)) continue;
    }
    if (!p->match(rules)) continue;
    bool excluded = false;
    for (const platform::Dictionary& exclusion : exclusions) {
      if (p->match(exclusion)) {
        QVLogOps().info("client %d plugin %{public}@ globally excluded", pid, uuidText(*p));
        excluded = true;
        break;
      }
    }
    if (excluded) continue;
    if (!all) {
      if (std::optional<std::string> reason = p->allowForClient(hostEntitlements)) {
        QVLogOps().info("client %d cannot use plugin %{public}@: %{public}@", pid, uuidText(*p),
                        *reason);
        continue;
      }
    }
    // Left by the merge, or by the export when there is nothing to merge.
    exports->enter();
    batch.push_back(p);
    if (batch.size() == kExportBatch) {
      exportBatch(std::move(batch));
      batch.clear();
    }
  }
  if (!batch.empty()) exportBatch(std::move(batch));
  {
    // Exports and merges run on other queues; the pool may add a thread
    // while this one waits.
    platform::dispatch::ScopedBlockingCall blocking;
    exports->wait();
  }

  results->finish();
  if (results->matches().empty()) {
    QVLogOps().info("Resulting plugin count: 0");
  } else if (QVLogOps().isEnabled(platform::log::Level::Info)) {
    platform::Array uuids;
    for (const MatchResults::Form& form : results->matches())
      uuids.append(form->get(QVFormUUIDKey));
    QVLogOps().info("Resulting plugin count: %u, UUIDs: %{public}@",
                    static_cast<unsigned>(results->matches().size()),
                    platform::Value(std::move(uuids)));
  }
  // The forms were encoded as they were merged; a version-2 request gets
  // none (their whole-value encoding is not defined for it), nor does a
  // list with a form that cannot travel, and the request still succeeds.
  if (std::optional<std::vector<platform::cbor::EncodedValue>> forms = results->encodedMatches()) {
    if (std::optional<platform::cbor::EncodedValue> converted =
            QVDaemonClient::convertToMBX(*forms, version())) {
      setReplyEncoded(std::string(QVDMatchesKey), std::move(*converted));
    }
  }
  QVLogOps().debug("reply marshalled");
  done();
}

}  // namespace qvd
