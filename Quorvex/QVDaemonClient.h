// The client side of the daemon's protocol: one message-system connection to
// the daemon's service, a builder for each request, asynchronous and
// synchronous sending, and the translation of error replies into errors.
//
//   auto client = QVDaemonClient::initWithServiceName(std::nullopt).value();
//   client->addPlugIns({"/Applications/A.app/PlugIns/x.ovx"},
//                      [](const platform::Result<platform::Value>& reply) {
//                        if (auto error = QVDaemonClient::errorInReply(reply)) { ... }
//                      });
//
// Every reply handler receives the raw reply body or, when the exchange
// failed (the daemon is not running, the connection ended first), the
// message system's error; errorInReply() turns either into an error object.
// The connection is made at creation and again, on the next request, after
// it ended (the daemon restarted, or was not running yet), so a client can
// outlive the daemon. Destroying the client ends its connection: requests
// still waiting complete with the connection's error. Whatever else the
// connection delivers (a message that is no reply, the daemon's goodbye,
// the connection's end) is logged as "Communications error: ..." (error
// level); the end the client itself causes when destroyed is not.
//
// Thread safety: every member may be called from any thread. Asynchronous
// replies and connection events arrive one at a time on the serial queue
// "qvd_client"; a synchronous request blocks only its caller and runs its
// handler on the calling thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/cbor/EncodedValue.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

// How a request travels: the caller waits for the reply, or not.
enum class QVDSending { Asynchronous, Synchronous };

// Receives the reply body, or the message system's error when there is none.
using QVDReplyHandler = std::function<void(const platform::Result<platform::Value>& reply)>;

// Plug-ins named by path and UUID. Sent as the parallel "paths" and "uuids"
// arrays, entry i of both from element i, so the order is the caller's.
using QVDPlugInMap = std::vector<std::pair<std::string, platform::Uuid>>;

class QVDaemonClient : public std::enable_shared_from_this<QVDaemonClient> {
 public:
  // Connects to `serviceName`, or to QVDServiceName when none is given. A
  // daemon that is not running does not make creation fail: the failure is
  // logged (info) and each request's handler receives the connection error
  // until the daemon can be reached. Fails only for a name no service can
  // have (the message system's BadServiceName).
  static platform::Result<std::shared_ptr<QVDaemonClient>> initWithServiceName(
      std::optional<std::string_view> serviceName);
  ~QVDaemonClient();
  QVDaemonClient(const QVDaemonClient&) = delete;
  QVDaemonClient& operator=(const QVDaemonClient&) = delete;

  // --- Requests. Paths and URLs are sent as given: the daemon judges them.

  void addPlugIns(const std::vector<std::string>& paths, QVDReplyHandler reply);
  void removePlugIns(const std::vector<std::string>& paths, QVDReplyHandler reply);
  void bulkPlugins(std::uint64_t flags, QVDReplyHandler reply);
  // "environment" is sent only when given.
  void readyPlugIns(const QVDPlugInMap& plugIns, QVDSending sending, std::uint64_t flags,
                    const std::optional<platform::Dictionary>& environment, QVDReplyHandler reply);
  void accessPlugIns(const QVDPlugInMap& plugIns, QVDSending sending, std::uint64_t flags,
                     QVDReplyHandler reply);
  // "uuids" carries the one UUID itself, not an array.
  void findPlugInByUUID(const platform::Uuid& uuid, QVDReplyHandler reply);
  // "paths" carries the URL's text ("file:///A.app/PlugIns/x.ovx"). A URL
  // that is not a file URL (see QVFileURL.h) is not sent: the handler gets
  // an error of code QVErrorBadPath instead, on the reply queue.
  void findPlugInByPathURL(std::string_view url, QVDReplyHandler reply);
  // Synchronous when `flags` has QVDiscoverSynchronous; the flags go out
  // unchanged either way.
  void matchPlugIns(const platform::Dictionary& rules, std::uint64_t flags, QVDReplyHandler reply);
  void setPluginAnnotations(const std::vector<platform::Uuid>& uuids,
                            const platform::Dictionary& annotations, QVDReplyHandler reply);
  void bulkSetPluginAnnotations(const platform::Dictionary& annotations, QVDReplyHandler reply);
  void holdPlugins(const std::vector<std::string>& paths, std::uint64_t flags,
                   QVDReplyHandler reply);
  // "uuids" carries an array of the one token.
  void releaseHold(const platform::Uuid& token, QVDReplyHandler reply);

  // --- Building blocks of the requests above, for requests of one's own.

  // {"request": name, "version": protocolVersion()}.
  platform::Dictionary request(std::string_view name) const;
  // The same with "paths": an array of the texts.
  platform::Dictionary request(std::string_view name, const std::vector<std::string>& paths) const;
  // Sets "uuids" and "paths" from the map, in its order.
  static void setPlugins(platform::Dictionary& message, const QVDPlugInMap& plugIns);
  // Sets "uuids" to an array of the UUIDs.
  static void setUuids(platform::Dictionary& message, const std::vector<platform::Uuid>& uuids);
  // Sends asynchronously: the handler runs later on the reply queue.
  void send(platform::Dictionary message, QVDReplyHandler reply);
  // Logs the request and, later, the reply (debug, traffic category). With
  // Synchronous, sets "sync" = true, waits for the reply and runs the handler
  // on the calling thread before returning; otherwise as send(). A
  // synchronous request may come from any thread, a handler running on the
  // reply queue included.
  void sendSynchronously(QVDSending sending, platform::Dictionary message, QVDReplyHandler reply);

  // --- Replies.

  // The error a reply reports, or none for success:
  //  - a failed exchange: an error of the Quorvex domain with code
  //    QVErrorInvalidRequest (4) whose description is the failure's (an
  //    error the library made itself, already of the Quorvex domain, as is);
  //  - "errorcode" non-zero: that code, described by "error" or, without
  //    one, by "unknown error returned by Quorvex subsystem";
  //  - neither "errorcode" (or 0) nor "error": none.
  // Throws QVInternalInconsistencyException when the daemon broke the
  // protocol: "error" without a code ("qvd reported error without a code:
  // <text>"), a body that is not a dictionary, an "errorcode" that is not a
  // non-negative 64-bit integer, or an "error" that is not text.
  static std::optional<platform::Error> errorInReply(
      const platform::Result<platform::Value>& reply);

  // The wire form of a property-list value for protocol `version`: for
  // version 3 the value's message encoding, which a reply carries as the
  // value itself, provided the codec can carry it (no none inside, every
  // text valid UTF-8); anything else, and any other version, gives none.
  static std::optional<platform::cbor::EncodedValue> convertToMBX(const platform::Value& value,
                                                                  std::uint64_t version);
  // The same for a list whose elements are encoded already: what the list
  // of their values gives, without walking them again.
  static std::optional<platform::cbor::EncodedValue> convertToMBX(
      std::span<const platform::cbor::EncodedValue> elements, std::uint64_t version);
  // The property-list value of a wire value when this client speaks
  // version 3; none for any other version.
  platform::Value convertFromMBX(const platform::Value& wireValue) const;

  std::uint64_t protocolVersion() const { return protocolVersion_.load(); }
  // Values one reply may hold (every key, value and element counts).
  static constexpr std::size_t kMaxReplyItems = std::size_t{1} << 21;
  const std::string& serviceName() const { return serviceName_; }
  // "qvd_client".
  const std::shared_ptr<platform::dispatch::SerialQueue>& replyQueue() const { return replyQueue_; }

  // Makes requests carry another version, as an old client would.
  void setProtocolVersionForTesting(std::uint64_t version) { protocolVersion_.store(version); }

 private:
  explicit QVDaemonClient(std::string serviceName);

  // The live connection, made now when there is none.
  platform::Result<std::shared_ptr<platform::mbx::Connection>> connection();
  // REQUIRES: mu_ held.
  platform::Result<std::shared_ptr<platform::mbx::Connection>> connectLocked();
  // Drops `ended` so that the next request connects again.
  void forget(const platform::mbx::Connection* ended);
  // Runs `reply` with `error` on the reply queue.
  void failLater(platform::Error error, QVDReplyHandler reply);

  const std::string serviceName_;
  const std::shared_ptr<platform::dispatch::SerialQueue> replyQueue_;
  std::atomic<std::uint64_t> protocolVersion_;
  // Set when this client ends its connection itself, so the event that
  // follows is not reported as a communications error.
  const std::shared_ptr<std::atomic<bool>> closing_;

  std::mutex mu_;
  std::shared_ptr<platform::mbx::Connection> qvd_;  // guarded by mu_
};
