// QVDaemonClient: reading replies (errors, wire values).
#include <limits>
#include <string>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVInternalInconsistencyException.h"
#include "platform/cbor/Cbor.h"

using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Value;

namespace {

[[noreturn]] void protocolBroken(const std::string& what) {
  throw QVInternalInconsistencyException(what);
}

// The "errorcode" of a reply: 0 when absent.
std::int64_t errorCodeOf(const Dictionary& body) {
  const Value* code = body.find(QVDErrorCodeKey);
  if (code == nullptr) return 0;
  std::optional<std::uint64_t> number = code->uint64();
  if (!number || *number > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
    protocolBroken("qvd reported an error code that is not one: " + code->description());
  }
  return static_cast<std::int64_t>(*number);
}

}  // namespace

std::optional<Error> QVDaemonClient::errorInReply(const Result<Value>& reply) {
  if (!reply.ok()) {
    // Errors the client library made itself are already in our terms.
    if (reply.error().domain() == QVQuorvexErrorDomain) return reply.error();
    return QVErrorWithCodeMessage(QVErrorInvalidRequest, reply.error().description());
  }
  const Dictionary* body = reply.value().dictionary();
  if (body == nullptr) {
    protocolBroken("qvd replied with something other than a dictionary: " +
                   reply.value().description());
  }
  const std::int64_t code = errorCodeOf(*body);
  const Value* text = body->find(QVDErrorKey);
  if (text != nullptr && text->string() == nullptr) {
    protocolBroken("qvd reported an error that is not text: " + text->description());
  }
  if (code == 0) {
    if (text != nullptr) protocolBroken("qvd reported error without a code: " + *text->string());
    return std::nullopt;
  }
  return QVErrorWithCodeMessage(static_cast<QVErrorCode>(code),
                                text != nullptr
                                    ? *text->string()
                                    : std::string("unknown error returned by Quorvex subsystem"));
}

std::optional<platform::cbor::EncodedValue> QVDaemonClient::convertToMBX(
    const Value& value, std::uint64_t version) {
  if (version != QVDProtocolVersion) return std::nullopt;
  // The codec is the judge of what can travel: a none nested anywhere, or
  // text that is not UTF-8, would only fail later, when sending.
  platform::Result<platform::cbor::EncodedValue> encoded =
      platform::cbor::EncodedValue::encode(value);
  if (!encoded.ok()) return std::nullopt;
  return std::move(encoded).value();
}

std::optional<platform::cbor::EncodedValue> QVDaemonClient::convertToMBX(
    std::span<const platform::cbor::EncodedValue> elements, std::uint64_t version) {
  if (version != QVDProtocolVersion) return std::nullopt;
  return platform::cbor::EncodedValue::array(elements);
}

Value QVDaemonClient::convertFromMBX(const Value& wireValue) const {
  // What arrived was decoded by the codec already: nothing more to check.
  if (protocolVersion() != QVDProtocolVersion) return Value();
  return wireValue;
}
