// Errors of the message system: one domain for connection and listener
// failures, and one for frames that break the wire rules, each with a code per
// kind of fault. Callers and tools match on the codes, never on the text.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::mbx {

inline constexpr std::string_view kErrorDomain = "MBX";

// Never renumber: these reach clients in error replies and logs.
enum class ErrorCode : std::int64_t {
  ConnectionInvalid = 1,     // the connection was cancelled, closed by the peer, or cut off
  TerminationImminent = 2,   // the peer said goodbye
  BadServiceName = 3,        // empty, "/", "..", control bytes, or too long for a socket path
  ServiceInUse = 4,          // a live listener already holds the name
  ServiceUnavailable = 5,    // nobody listens under the name
  SocketFailure = 6,         // the kernel refused a socket call (errno in the text)
  TooManyPendingReplies = 7, // the per-connection bound on awaited replies is reached
  BodyTooLarge = 8,          // an outgoing body over the frame limit
  UnencodableBody = 9,       // an outgoing body CBOR cannot carry (a none value, bad UTF-8)
  WouldDeadlock = 10,        // a synchronous request from the connection's own delivery queue
  NotResumed = 11,           // a synchronous request on a connection that was never resumed
};

// The domain of frame faults, separate so that a broken frame is never
// mistaken for a connection failure.
inline constexpr std::string_view kFrameErrorDomain = "MBX.Frame";

// Each rule of the framing, broken. Never renumber.
enum class FrameFault : std::int64_t {
  BadMagic = 1,
  UnknownVersion = 2,
  UnknownFlags = 3,            // bits outside 0x7
  ConflictingFlags = 4,        // more than one of reply-expected, reply, goodbye
  ZeroMessageId = 5,
  NonIncreasingMessageId = 6,
  BodyTooLarge = 7,
  GoodbyeWithBody = 8,
  ReplyWithoutRequestId = 9,   // the reply flag with in-reply-to 0
  RequestIdWithoutReply = 10,  // in-reply-to set on a frame that is not a reply
  TruncatedAtEof = 11,         // the stream ended inside a frame
  UndecodableBody = 12,        // the body is not exactly one acceptable CBOR item
};

// "connection invalid", "bad magic", ...: short fixed names for logs and tests.
const char* errorCodeName(ErrorCode code);
const char* frameFaultName(FrameFault fault);

// An error of kErrorDomain; `detail`, when given, follows the name.
platform::Error makeError(ErrorCode code, std::string_view detail = {});
platform::Error makeFrameError(FrameFault fault, std::string_view detail = {});

// The code of an error of the matching domain; none for any other error.
std::optional<ErrorCode> errorCodeOf(const platform::Error& error);
std::optional<FrameFault> frameFaultOf(const platform::Error& error);

}  // namespace platform::mbx
