// The daemon's one server: the plug-in database extended with the service
// that clients reach: the listener on the service name, the queues requests
// run on, the SIGTERM handler, the preferences object and the hold list.
//
//   queue "mbx"         listener events and client creation
//   queue "service"     every request's dispatch, one at a time in arrival
//                       order (user-initiated priority)
//   queue "serverSync"  every read and change of the hold list
//
// Thread safety: the accessors and submitWork() are safe from any queue;
// the hold list is confined to the hold queue, and code already running on
// that queue must not wait on it.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/SignalSource.h"
#include "platform/mbx/Listener.h"
#include "qvd/Platform.h"
#include "qvd/QVDPlugInHold.h"
#include "qvd/QVDUserPrefs.h"
#include "qvd/QVDatabase.h"

namespace qvd {

class QVDMbxClient;

enum class Submission { Asynchronous, Synchronous };
// Whether the server takes SIGTERM (the daemon does; a test that builds a
// server in process does not).
enum class TerminationSignal { Watched, NotWatched };

class QVDServer final : public QVDatabase,
                        public QVDatabaseDelegate,
                        public std::enable_shared_from_this<QVDServer> {
 public:
  // Builds the server: the database part, the queues, the listener (not yet
  // resumed), the hold list, the process-wide instance, the preferences and
  // the SIGTERM source on the main queue. None (with the reason logged) when
  // any part cannot be made.
  // REQUIRES: platform.complete(); called on the main thread, before other
  //           threads of the caller's own exist (so that SIGTERM stays
  //           blocked everywhere but in the signal source).
  static std::shared_ptr<QVDServer> initForService(std::string serviceName,
                                                   std::optional<std::string> databasePath,
                                                   Platform platform,
                                                   TerminationSignal signal = TerminationSignal::Watched);

  // The server made by initForService(); none before.
  static std::shared_ptr<QVDServer> server();

  // Resumes the listener and serves the main queue until the process ends.
  // REQUIRES: the main thread.
  [[noreturn]] void run();
  // Resumes the listener only; for callers that run the main loop themselves.
  void resumeForTesting();

  // Cancels the listener and releases every hold, then posts one
  // annotation-change notification (also when there were no holds). Waits
  // on the hold queue.
  // REQUIRES: not on the hold queue.
  void stop();

  // Queues `work` on the service queue. Synchronous: logs so and runs it
  // there, returning once it has finished.
  // REQUIRES for Synchronous: not on the service queue.
  void submitWork(std::function<void()> work, Submission submission);

  // ---- Holds and forced termination (QVDServerHolds.cpp) ----
  // The hold operations run on the hold queue and wait for it; each change
  // posts the annotation-change notification, so hosts re-read their
  // plug-in lists. REQUIRES for each: not on the hold queue.

  // True when any current hold blocks `plugIn`.
  bool holdOnPlugIn(const QVDPlugIn& plugIn) const;
  // Appends `hold` to the list, then posts.
  void addHold(std::shared_ptr<const QVDPlugInHold> hold);
  // Removes the first hold whose token is `token` and posts; a token no
  // hold has changes nothing and posts nothing.
  void unholdToken(const platform::Uuid& token);
  // Removes every hold `client` took, posting once per removed hold, then
  // runs `then` (if any) on the hold queue. Returns at once: many peers may
  // vanish together, and a pool thread waiting here for each of them would
  // exhaust the pool. What comes to the hold queue later sees them removed.
  void unholdClient(std::shared_ptr<QVDMbxClient> client, std::function<void()> then = {});
  // The holds as they are now, in the order they were added.
  std::vector<std::shared_ptr<const QVDPlugInHold>> holds() const;

  // Asks the service manager to end the running processes of each plug-in
  // in `records`, then runs `reply` on a queue "killer-waiter" of this call
  // once every request has been answered (at once for no records). There is
  // no time-out. Returns at once.
  void terminatePlugInsReply(std::vector<platform::holvane::PlugInRecord> records,
                             std::function<void()> reply);
  // The database's delegate: ends the processes of plug-ins being
  // uninstalled. Returns at once; termination goes on in the background.
  void removedPlugIns(const std::vector<platform::holvane::PlugInRecord>& records) override;

  const std::string& serviceName() const { return serviceName_; }
  const Platform& platform() const { return platform_; }
  const QVDUserPrefs& userPrefs() const { return *userPrefs_; }
  const std::shared_ptr<platform::dispatch::SerialQueue>& mbxQueue() const { return mbxQueue_; }
  const std::shared_ptr<platform::dispatch::SerialQueue>& mainQueue() const { return mainQueue_; }
  const std::shared_ptr<platform::dispatch::SerialQueue>& holdQueue() const { return syncQueue_; }

  // What the SIGTERM handler does after stop(): by default it ends the
  // process with status 0.
  void setTerminationActionForTesting(std::function<void()> action);
  // Forgets the process-wide instance so that a test can build another.
  static void resetForTesting();
  // Tells the client observer (if any) of a client about to be resumed.
  // REQUIRES: on the listener queue.
  void noteNewClient(const std::shared_ptr<QVDMbxClient>& client);
  // Runs `observer` on the listener queue with every client made, before
  // its first event.
  void setClientObserverForTesting(std::function<void(std::shared_ptr<QVDMbxClient>)> observer);

  QVDServer(std::string serviceName, Platform platform);  // use initForService()
  ~QVDServer() override;

 private:
  static void forgetInstance();
  void handleListenerEvent(const platform::mbx::Listener::Event& event);
  void terminate();

  const std::string serviceName_;
  const Platform platform_;
  const std::shared_ptr<platform::dispatch::SerialQueue> mbxQueue_;
  const std::shared_ptr<platform::dispatch::SerialQueue> mainQueue_;
  const std::shared_ptr<platform::dispatch::SerialQueue> syncQueue_;
  std::shared_ptr<platform::mbx::Listener> service_;
  std::unique_ptr<QVDUserPrefs> userPrefs_;
  std::shared_ptr<platform::dispatch::SignalSource> sigSource_;
  std::function<void()> terminationAction_;  // set before the source is resumed
  std::function<void(std::shared_ptr<QVDMbxClient>)> clientObserver_;  // set before resume
  // Touched only on syncQueue_.
  std::vector<std::shared_ptr<const QVDPlugInHold>> holds_;
};

}  // namespace qvd
