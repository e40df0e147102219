// annotate, bulk-annotate and watch: annotations and their change notice.
#include <atomic>

#include "Quorvex/QVAnnotationChangeObserver.h"
#include "Quorvex/QVDConstants.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "tools/qvctl/QvctlCommands.h"
#include "tools/qvctl/QvctlOutput.h"

namespace qvctl::internal {

using platform::Dictionary;
using platform::Result;
using platform::Value;

int runAnnotationCommand(const Session& session) {
  const Invocation& invocation = session.invocation;
  QVDaemonClient& client = session.client;
  Result<Value> reply = awaitReply([&](QVDReplyHandler done) {
    if (invocation.command == Command::Annotate) {
      client.setPluginAnnotations(invocation.uuids, invocation.annotations, std::move(done));
    } else {
      client.bulkSetPluginAnnotations(invocation.annotations, std::move(done));
    }
  });
  std::optional<Dictionary> body = successfulReply(reply, session.environment.err);
  if (!body) return kExitError;
  printReply(session, *body);
  return kExitOk;
}

int runWatch(const Invocation& invocation, const Environment& environment) {
  std::shared_ptr<platform::notify::NotificationCenter> center = environment.notifications;
  if (!center) center = std::make_shared<platform::notify::LinuxNotificationCenter>();
  auto queue = platform::dispatch::SerialQueue::create("qvctl.watch");
  platform::dispatch::Semaphore finished;
  std::uint64_t lines = 0;  // only touched on `queue`
  auto observer = QVAnnotationChangeObserver::start(center, queue, [&](std::uint64_t count) {
    if (invocation.count && lines == *invocation.count) return;
    if (invocation.format == OutputFormat::Json) {
      std::fprintf(environment.out, "{\"notification\":\"%s\",\"count\":%llu}\n",
                   std::string(QVNotifyAnnotationChange).c_str(),
                   static_cast<unsigned long long>(count));
    } else {
      std::fprintf(environment.out, "%s %llu\n", std::string(QVNotifyAnnotationChange).c_str(),
                   static_cast<unsigned long long>(count));
    }
    std::fflush(environment.out);
    if (invocation.count && ++lines == *invocation.count) finished.signal();
  });
  if (!observer.ok()) {
    std::fprintf(environment.err, "qvctl: cannot watch %s: %s\n",
                 std::string(QVNotifyAnnotationChange).c_str(),
                 observer.error().description().c_str());
    return kExitError;
  }
  // Without --count this waits until the process is stopped.
  finished.wait();
  // Cancelled on the callback's queue, so none runs once the locals are gone.
  queue->sync([&] { observer.value()->cancel(); });
  return kExitOk;
}

}  // namespace qvctl::internal
