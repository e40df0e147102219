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
  const Value body(std::move(body_));
  if (platform::Status sent = connection->sendReply(requestId_, body); !sent.ok()) {
    body_ = *body.dictionary();  // nothing went out: the caller may send another body
    return sent;
  }
  sent_ = true;
  // Whatever the peer does now, this reply no longer keeps the process busy.
  transaction_.reset();
  return platform::okStatus();
}

}  // namespace platform::mbx
