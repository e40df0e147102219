#include "platform/mbx/Reply.h"

#include "platform/mbx/Connection.h"
#include "platform/mbx/internal/MbxLog.h"

namespace platform::mbx {

Reply::Reply(std::weak_ptr<Connection> connection, std::uint64_t requestId, bool expected,
             std::shared_ptr<KeepAliveTransaction> transaction)
    : connection_(std::move(connection)),
      requestId_(requestId),
      expected_(expected),
      transaction_(std::move(transaction)) {}

Reply Reply::createReply(const Message& request) {
  return Reply(request.connection_, request.id(), request.expectsReply(), request.transaction_);
}

void Reply::setEncoded(std::string key, platform::cbor::EncodedValue value) {
  body_.remove(key);
  for (platform::cbor::EncodedEntry& entry : encoded_) {
    if (entry.first == key) {
      entry.second = std::move(value);
      return;
    }
  }
  encoded_.emplace_back(std::move(key), std::move(value));
}

void Reply::replaceBody(platform::Dictionary body) {
  body_ = std::move(body);
  encoded_.clear();
}

platform::Dictionary Reply::bodyForDescription() const {
  platform::Dictionary whole = body_;
  for (const auto& [key, value] : encoded_) whole.set(key, value.decode());
  return whole;
}

platform::Status Reply::send() {
  if (sent_) return platform::okStatus();
  if (!expected_) {
    sent_ = true;
    transaction_.reset();
    internal::mbxLog().debug("reply to message %llu dropped: it expected no reply",
                             static_cast<unsigned long long>(requestId_));
    return platform::okStatus();
  }
  std::shared_ptr<Connection> connection = connection_.lock();
  if (!connection) {
    sent_ = true;
    transaction_.reset();
    internal::mbxLog().debug("reply to request %llu dropped: its connection is gone",
                             static_cast<unsigned long long>(requestId_));
    return platform::okStatus();
  }
  // The encoded entry wins over a body() entry of its key set later.
  for (const auto& entry : encoded_) body_.remove(entry.first);
  const Value body(std::move(body_));
  if (platform::Status sent = connection->sendReply(requestId_, body, encoded_); !sent.ok()) {
    body_ = *body.dictionary();  // nothing went out: the caller may send another body
    return sent;
  }
  sent_ = true;
  // Whatever the peer does now, this reply no longer keeps the process busy.
  transaction_.reset();
  return platform::okStatus();
}

}  // namespace platform::mbx
