// add, remove, bulk, hold and release: registering plug-ins and holding them.
#include "Quorvex/QVDConstants.h"
#include "tools/qvctl/QvctlCommands.h"
#include "tools/qvctl/QvctlOutput.h"

namespace qvctl::internal {

using platform::Dictionary;
using platform::Result;
using platform::Uuid;
using platform::Value;

namespace {

// The hold token of a "lock" reply: its "uuids", one UUID or the first of
// an array, in either wire form (a UUID or its text).
std::optional<Uuid> holdToken(const Dictionary& body) {
  const Value* uuids = body.find(QVDUUIDKey);
  if (uuids == nullptr) return std::nullopt;
  const Value* first = uuids;
  if (const auto* array = uuids->array()) first = array->at(0);
  if (first == nullptr) return std::nullopt;
  if (std::optional<Uuid> uuid = first->uuid()) return uuid;
  if (const std::string* text = first->string()) return Uuid::parse(*text);
  return std::nullopt;
}

int printHold(const Session& session, const Dictionary& body) {
  std::optional<Uuid> token = holdToken(body);
  if (!token) {
    std::fputs("qvctl: the daemon's reply carries no hold token\n", session.environment.err);
    return kExitError;
  }
  if (session.invocation.format == OutputFormat::Json) {
    std::fputs(formatJson(Dictionary{{"token", Value(*token)}}).c_str(), session.environment.out);
  } else {
    std::fprintf(session.environment.out, "%s\n", token->toString().c_str());
  }
  return kExitOk;
}

// The hold lives as long as this connection: keep it until standard input
// ends, then release it and say so.
int keepHoldUntilEndOfInput(const Session& session, const Uuid& token) {
  std::fflush(session.environment.out);
  char buffer[256];
  while (std::fread(buffer, 1, sizeof buffer, stdin) > 0) {
  }
  Result<Value> reply = awaitReply(
      [&](QVDReplyHandler done) { session.client.releaseHold(token, std::move(done)); });
  if (!successfulReply(reply, session.environment.err)) return kExitError;
  return kExitOk;
}

}  // namespace

int runPlugInCommand(const Session& session) {
  const Invocation& invocation = session.invocation;
  QVDaemonClient& client = session.client;
  Result<Value> reply = awaitReply([&](QVDReplyHandler done) {
    switch (invocation.command) {
      case Command::Add:
        client.addPlugIns(invocation.paths, std::move(done));
        break;
      case Command::Remove:
        client.removePlugIns(invocation.paths, std::move(done));
        break;
      case Command::Bulk:
        client.bulkPlugins(invocation.flags, std::move(done));
        break;
      case Command::Hold:
        client.holdPlugins(invocation.paths, invocation.flags, std::move(done));
        break;
      default:
        client.releaseHold(invocation.uuids.at(0), std::move(done));
        break;
    }
  });
  std::optional<Dictionary> body = successfulReply(reply, session.environment.err);
  if (!body) return kExitError;
  if (invocation.command == Command::Hold) {
    const int printed = printHold(session, *body);
    if (printed != kExitOk || !invocation.waitForEndOfInput) return printed;
    return keepHoldUntilEndOfInput(session, *holdToken(*body));
  }
  printReply(session, *body);
  return kExitOk;
}

}  // namespace qvctl::internal
