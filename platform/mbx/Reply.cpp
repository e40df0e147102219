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

void Reply::send() {
  if (sent_) return;
  sent_ = true;
  // Whatever happens below, this reply no longer keeps the process busy.
  std::shared_ptr<KeepAliveTransaction> transaction = std::move(transaction_);
  if (!expected_) {
    internal::mbxLog().debug("reply to message %llu dropped: it expected no reply",
                             static_cast<unsigned long long>(requestId_));
    return;
  }
  std::shared_ptr<Connection> connection = connection_.lock();
  if (!connection) {
    internal::mbxLog().debug("reply to request %llu dropped: its connection is gone",
                             static_cast<unsigned long long>(requestId_));
    return;
  }
  connection->sendReply(requestId_, Value(std::move(body_)));
}

}  // namespace platform::mbx
