// An incoming message: its body, its frame id and kind, and (weakly) the
// connection it came from, so that a reply can be routed back. A request (a
// message that expects a reply) holds a keep-alive transaction until it and
// every Reply made from it are gone or the reply is sent.
//
// Thread safety: immutable; copies may be used from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/mbx/Frame.h"
#include "platform/mbx/KeepAliveTransaction.h"
#include "platform/values/Value.h"

namespace platform::mbx {

class Connection;

class Message {
 public:
  const platform::Value& body() const { return body_; }
  // A well-formed body need not be a map; the receiver decides what to do
  // with one that is not.
  bool isDictionary() const { return body_.dictionary() != nullptr; }
  // The body's dictionary, or null.
  const platform::Dictionary* dictionary() const { return body_.dictionary(); }

  std::uint64_t id() const { return id_; }
  FrameKind kind() const { return kind_; }
  bool expectsReply() const { return kind_ == FrameKind::Request; }
  bool isReply() const { return kind_ == FrameKind::Reply; }
  // For a reply, the id of the request it answers; otherwise 0.
  std::uint64_t inReplyTo() const { return inReplyTo_; }

  // The connection it came on, or null once that is gone.
  std::shared_ptr<Connection> connection() const { return connection_.lock(); }

  // "request 7 on <connection>: {...}" (the body is described in full).
  std::string description() const;

  // A message as if received on `connection` (which may be empty).
  static Message makeForTesting(platform::Value body, FrameKind kind, std::uint64_t id,
                                std::uint64_t inReplyTo = 0,
                                std::weak_ptr<Connection> connection = {});

 private:
  friend class Connection;
  friend class Reply;
  Message(platform::Value body, FrameKind kind, std::uint64_t id, std::uint64_t inReplyTo,
          std::weak_ptr<Connection> connection);

  platform::Value body_;
  FrameKind kind_;
  std::uint64_t id_;
  std::uint64_t inReplyTo_;
  std::weak_ptr<Connection> connection_;
  // Requests only: shared with the replies made from this message.
  std::shared_ptr<KeepAliveTransaction> transaction_;
};

}  // namespace platform::mbx
