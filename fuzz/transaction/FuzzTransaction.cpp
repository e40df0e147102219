// One whole request through the daemon: the first byte says who the client
// is (FuzzDaemon.h, ClientSettings), the rest is the body of the request
// frame, decoded with the limits a connection applies. A body that is not a
// map is skipped (the client drops such messages before any transaction is
// made). "$ROOT" in top-level strings names the platform root.
//
// The request is sent over a real connection, so it passes the client's
// request handling and the transaction's dispatch as any other would.
// Checks, for every request:
//  - a reply comes within kReplyLimit, and the connection stays (a second
//    reply is refused by the transaction, with a fault logged: see below);
//  - the reply is a map; "errorcode" is a non-zero unsigned with an "error"
//    text beside it, or neither is there;
//  - nothing logs a fault (a second reply, a failure after the reply, ...).
// QV_FUZZ_SHOW_REPLIES=1 prints each request and its reply (for writing
// seeds: does this one reach the handler it was written for?).
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <span>

#include "Quorvex/QVDConstants.h"
#include "fuzz/transaction/FuzzDaemon.h"
#include "platform/cbor/Cbor.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/mbx/ConnectionLimits.h"

namespace {

using namespace std::chrono_literals;
using qvd::fuzzing::ClientSettings;
using qvd::fuzzing::FuzzDaemon;

// Far beyond any request of this catalogue, even on a loaded machine. A
// request without a reply by then is reported either way; the grace only
// tells a slow reply from a lost one.
constexpr auto kReplyLimit = 10s;
constexpr auto kGrace = 60s;

platform::log::LogCaptureForTesting& capture() {
  static auto* lines = new platform::log::LogCaptureForTesting(platform::log::CaptureEcho::Silent);
  return *lines;
}

[[noreturn]] void fail(const char* what, const platform::Value& request) {
  for (const auto& line : capture().lines()) {
    std::fprintf(stderr, "  log: [%s:%s] %s\n", line.subsystem.c_str(), line.category.c_str(),
                 line.message.c_str());
  }
  std::fprintf(stderr, "fuzz_transaction: %s\n  request: %s\n", what,
               request.description().c_str());
  std::abort();
}

void checkReply(const platform::Value& reply, const platform::Value& request) {
  const platform::Dictionary* body = reply.dictionary();
  if (body == nullptr) fail("the reply is not a map", request);
  const platform::Value& code = body->get(QVDErrorCodeKey);
  const platform::Value& text = body->get(QVDErrorKey);
  if (code.isNone() != text.isNone()) fail("an error code without a text, or the reverse", request);
  if (code.isNone()) return;
  if (code.uint64().value_or(0) == 0) fail("an error code that is not a positive integer", request);
  if (text.string() == nullptr) fail("an error text that is not a string", request);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const platform::mbx::FrameLimits frame;
  platform::cbor::DecodeLimits limits;
  limits.maxBytes = frame.maxBodyBytes;
  limits.maxDepth = frame.maxDepth;
  limits.maxItems = frame.maxItems;
  auto body = platform::cbor::decode(std::span(data + 1, size - 1), limits);
  if (!body.ok() || body->dictionary() == nullptr) return 0;

  capture().clear();  // made first, so that the daemon's set-up is captured too
  FuzzDaemon& daemon = FuzzDaemon::instance();
  daemon.apply(ClientSettings::fromByte(data[0]));
  const platform::Value request = daemon.withRoot(*body);
  auto pending = daemon.send(request);
  if (!pending->waitFor(kReplyLimit)) {
    std::fprintf(stderr, "fuzz_transaction: no reply after %llds (%s); waiting %llds more\n",
                 static_cast<long long>(kReplyLimit.count()), daemon.connectionState().c_str(),
                 static_cast<long long>(kGrace.count()));
    fail(pending->waitFor(kGrace) ? "the reply came late" : "no reply at all", request);
  }
  const auto& reply = pending->reply();
  if (!reply.ok()) fail("the request failed on the connection", request);
  checkReply(reply->body(), request);
  static const bool show = std::getenv("QV_FUZZ_SHOW_REPLIES") != nullptr;
  if (show) {
    std::fprintf(stderr, "request: %s\nreply: %s\n", request.description().c_str(),
                 reply->body().description().c_str());
  }
  // What the request queued behind its reply (a late second reply, say)
  // has run once the service queue is empty.
  daemon.drainServiceQueue();
  for (const auto& line : capture().lines()) {
    if (line.level == platform::log::Level::Fault) fail("a fault was logged", request);
  }
  daemon.restore();
  return 0;
}
