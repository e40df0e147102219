#include "platform/mbx/MbxError.h"

namespace platform::mbx {

const char* errorCodeName(ErrorCode code) {
  switch (code) {
    case ErrorCode::ConnectionInvalid: return "connection invalid";
    case ErrorCode::TerminationImminent: return "termination imminent";
    case ErrorCode::BadServiceName: return "bad service name";
    case ErrorCode::ServiceInUse: return "service in use";
    case ErrorCode::ServiceUnavailable: return "service unavailable";
    case ErrorCode::SocketFailure: return "socket failure";
    case ErrorCode::TooManyPendingReplies: return "too many pending replies";
    case ErrorCode::BodyTooLarge: return "body too large";
    case ErrorCode::UnencodableBody: return "unencodable body";
    case ErrorCode::WouldDeadlock: return "would deadlock";
    case ErrorCode::NotResumed: return "not resumed";
  }
  return "unknown";
}

const char* frameFaultName(FrameFault fault) {
  switch (fault) {
    case FrameFault::BadMagic: return "bad magic";
    case FrameFault::UnknownVersion: return "unknown frame version";
    case FrameFault::UnknownFlags: return "unknown flag bits";
    case FrameFault::ConflictingFlags: return "conflicting flags";
    case FrameFault::ZeroMessageId: return "zero message id";
    case FrameFault::NonIncreasingMessageId: return "non-increasing message id";
    case FrameFault::BodyTooLarge: return "body length over the limit";
    case FrameFault::GoodbyeWithBody: return "goodbye with a body";
    case FrameFault::ReplyWithoutRequestId: return "reply with in-reply-to 0";
    case FrameFault::RequestIdWithoutReply: return "in-reply-to on a frame that is no reply";
    case FrameFault::TruncatedAtEof: return "stream ended inside a frame";
    case FrameFault::UndecodableBody: return "undecodable body";
  }
  return "unknown";
}

namespace {

std::string describe(const char* name, std::string_view detail) {
  std::string text = name;
  if (!detail.empty()) {
    text += ": ";
    text += detail;
  }
  return text;
}

}  // namespace

Error makeError(ErrorCode code, std::string_view detail) {
  return Error(std::string(kErrorDomain), static_cast<std::int64_t>(code),
               describe(errorCodeName(code), detail));
}

Error makeFrameError(FrameFault fault, std::string_view detail) {
  return Error(std::string(kFrameErrorDomain), static_cast<std::int64_t>(fault),
               describe(frameFaultName(fault), detail));
}

std::optional<ErrorCode> errorCodeOf(const Error& error) {
  if (error.domain() != kErrorDomain) return std::nullopt;
  if (error.code() < 1 || error.code() > static_cast<std::int64_t>(ErrorCode::NotResumed)) {
    return std::nullopt;
  }
  return static_cast<ErrorCode>(error.code());
}

std::optional<FrameFault> frameFaultOf(const Error& error) {
  if (error.domain() != kFrameErrorDomain) return std::nullopt;
  if (error.code() < 1 || error.code() > static_cast<std::int64_t>(FrameFault::UndecodableBody)) {
    return std::nullopt;
  }
  return static_cast<FrameFault>(error.code());
}

}  // namespace platform::mbx
