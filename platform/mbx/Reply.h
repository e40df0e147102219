// A reply under construction, made from a request. Its body starts as an
// empty dictionary; send() routes it to the connection the request came on,
// answering the request's id. When that connection has gone, or the request
// expected no reply, the reply is dropped harmlessly (logged at debug level):
// a daemon answering a client that just exited is no error.
//
//   void handle(const mbx::Message& request) {
//     auto reply = mbx::Reply::createReply(request);
//     reply.body().set("status", 0);
//     (void)reply.send();
//   }
//
// Thread safety: a plain value; build and send it from one thread at a time.
// send() itself may be called from any queue.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/cbor/EncodedValue.h"
#include "platform/mbx/KeepAliveTransaction.h"
#include "platform/mbx/Message.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::mbx {

class Connection;

class Reply {
 public:
  static Reply createReply(const Message& request);

  Reply(Reply&&) noexcept = default;
  Reply& operator=(Reply&&) noexcept = default;
  Reply(const Reply&) = delete;
  Reply& operator=(const Reply&) = delete;

  platform::Dictionary& body() { return body_; }
  // Adds an entry whose value is already encoded; it replaces an entry of
  // the same key, encoded or not. The peer cannot tell it from a body()
  // entry: this only spares the sender a second walk of a large value.
  // An entry of this key set on body() afterwards is ignored.
  void setEncoded(std::string key, platform::cbor::EncodedValue value);
  // Replaces the whole body, encoded entries included.
  void replaceBody(platform::Dictionary body);
  // The body with the encoded entries decoded back: for descriptions only,
  // as it costs a full decode.
  platform::Dictionary bodyForDescription() const;
  std::uint64_t requestId() const { return requestId_; }

  // Sends the body (moved out) once; later calls do nothing. Ends the
  // request's keep-alive transaction as far as this reply is concerned.
  // Fails, sending nothing and keeping the body, when the body cannot be
  // put into a frame (BodyTooLarge, or a value the codec cannot carry): the
  // caller may then replace the body and send again, so that the peer is
  // never left waiting for a reply that will not come.
  platform::Status send();
  bool sent() const { return sent_; }

 private:
  Reply(std::weak_ptr<Connection> connection, std::uint64_t requestId, bool expected,
        std::shared_ptr<KeepAliveTransaction> transaction);

  std::weak_ptr<Connection> connection_;
  std::uint64_t requestId_;
  bool expected_;
  bool sent_ = false;
  platform::Dictionary body_;
  std::vector<platform::cbor::EncodedEntry> encoded_;
  std::shared_ptr<KeepAliveTransaction> transaction_;
};

}  // namespace platform::mbx
