#include "platform/mbx/Message.h"

#include "platform/mbx/Connection.h"

namespace platform::mbx {

Message::Message(Value body, FrameKind kind, std::uint64_t id, std::uint64_t inReplyTo,
                 std::weak_ptr<Connection> connection)
    : body_(std::move(body)),
      kind_(kind),
      id_(id),
      inReplyTo_(inReplyTo),
      connection_(std::move(connection)) {
  if (kind_ == FrameKind::Request) transaction_ = std::make_shared<KeepAliveTransaction>();
}

Message Message::makeForTesting(Value body, FrameKind kind, std::uint64_t id,
                                std::uint64_t inReplyTo, std::weak_ptr<Connection> connection) {
  return Message(std::move(body), kind, id, inReplyTo, std::move(connection));
}

std::string Message::description() const {
  std::string text = frameKindName(kind_);
  text += ' ';
  text += std::to_string(id_);
  if (kind_ == FrameKind::Reply) {
    text += " to ";
    text += std::to_string(inReplyTo_);
  }
  if (auto connection = connection_.lock()) {
    text += " on ";
    text += connection->description();
  }
  text += ": ";
  text += body_.description();
  return text;
}

}  // namespace platform::mbx
