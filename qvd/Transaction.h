// One request being served: made by the client for every request message,
// dispatched on the service queue, finished exactly once with a success reply
// (done) or an error reply (failMessage / failError). A handler may finish
// later, from any queue, by keeping a reference to the transaction.
//
// Thread safety: dispatch, the handlers' synchronous parts and the input
// readers run on the service queue. done() and the fail operations may run
// on any queue; the first call sends the reply and later ones are refused
// (logged), so a reply is never sent twice.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/mbx/Message.h"
#include "platform/mbx/Reply.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"

namespace qvd {

class QVDMbxClient;
class QVDPlugIn;
class QVDServer;

enum class PathResolution { Resolved, Unresolved };

class Transaction : public std::enable_shared_from_this<Transaction> {
 public:
  // Called for each element of "paths": the resolved path (or the text as
  // received when it cannot be resolved). Returns false to stop; it has then
  // failed the transaction, or is about to.
  using PathCallback = std::function<bool(const std::string& path, PathResolution resolution)>;
  // Called for each plug-in "uuids" names. Returns false to stop.
  using PlugInCallback = std::function<bool(const std::shared_ptr<const QVDPlugIn>& plugIn)>;

  // REQUIRES: request is a dictionary message; client is not null.
  static std::shared_ptr<Transaction> initWithRequestForClient(
      const platform::mbx::Message& request, std::shared_ptr<QVDMbxClient> client);

  // Checks the version and the client's state and calls the request's
  // handler. REQUIRES: on the service queue.
  void dispatch();

  // The request handlers, one per request name.
  void addPlugIns();
  void removePlugIns();
  void bulkPlugIns();
  void matchPlugIns();
  void readyPlugIns();
  void accessPlugIns();
  void annotatePlugIns();
  void bulkAnnotatePlugIns();
  void lockDownPlugIns();
  void findPlugIn();

  // Reads "paths" and hands each element to `callback`, resolved with
  // realpath when it can be. True when every element passed.
  bool marshalPaths(const PathCallback& callback);
  // marshalPaths(), then done() when it returned true.
  bool processPaths(const PathCallback& callback);
  // Resolves each element of "uuids" to a plug-in, by the parallel "paths"
  // when the UUID is unknown. True when every element passed. Does not
  // finish the transaction on success.
  bool processUuidList(const PlugInCallback& callback);

  // ---- Annotations (TransactionAnnotations.cpp) ----

  // Whether a plug-in without an annotation is shown as elected: never.
  bool pluginShouldBeAutoEnabled(const QVDPlugIn& plugIn) const;
  // Sets form["annotations"] to the plug-in's annotation, or to an empty
  // dictionary when it has none.
  void addAnnotationForPlugIn(const QVDPlugIn& plugIn, platform::Dictionary& form) const;

  // ---- Find (TransactionFind.cpp) ----

  // The plug-in with the UUID of a wire UUID value, or none.
  std::shared_ptr<QVDPlugIn> findPlugInByUUID(const platform::Value& wireUuid) const;
  // The plug-in whose bundle the URL text of a wire string names, or none.
  std::shared_ptr<QVDPlugIn> findPlugInByPathURL(const platform::Value& wireUrl) const;

  // Sends the reply.
  void done();
  // Adds "errorcode" and "error" to the reply, then done().
  void failMessage(std::int64_t code, std::string message);
  // An error of the Quorvex domain fails with its own code and description;
  // any other with `code` and the error's description.
  void failError(std::int64_t code, const platform::Error& error);

  const platform::Dictionary& request() const { return request_; }
  // The reply being built. REQUIRES: the transaction is not yet finished and
  // only one queue builds it at a time.
  platform::Dictionary& reply() { return reply_.body(); }
  // Puts a value already in its wire encoding into the reply under `key`.
  // REQUIRES: as for reply().
  void setReplyEncoded(std::string key, platform::cbor::EncodedValue value) {
    reply_.setEncoded(std::move(key), std::move(value));
  }
  std::uint64_t version() const { return version_.load(); }
  bool finished() const { return finished_.load(); }

  // Serves requests named `name` with `handler`, after the request table
  // (so no table name can be taken over). For tests of the shared inputs
  // and of dispatch order; the daemon itself registers nothing.
  static void addRequestForTesting(std::string name, std::function<void(Transaction&)> handler);
  static void removeRequestsForTesting();

  const std::shared_ptr<QVDMbxClient>& client() const { return client_; }
  const std::shared_ptr<QVDServer>& server() const;
  std::shared_ptr<platform::mbx::Connection> connection() const;

 private:
  Transaction(const platform::mbx::Message& request, std::shared_ptr<QVDMbxClient> client);

  const std::shared_ptr<QVDMbxClient> client_;
  const platform::Dictionary request_;
  platform::mbx::Reply reply_;
  std::atomic<std::uint64_t> version_{0};
  std::atomic<bool> finished_{false};
};

}  // namespace qvd
