// match, find, ready and access: questions about plug-ins.
#include "Quorvex/QVDConstants.h"
#include "tools/qvctl/QvctlCommands.h"
#include "tools/qvctl/QvctlOutput.h"

namespace qvctl::internal {

using platform::Dictionary;
using platform::Result;
using platform::Value;

namespace {

// The plug-in forms of a match or find reply, or the reply as it is when it
// carries none.
void printForms(const Session& session, Dictionary body) {
  if (const Value* matches = body.find(QVDMatchesKey)) {
    Value forms = session.client.convertFromMBX(*matches);
    if (session.invocation.format == OutputFormat::Human) {
      std::fputs(formatForms(forms).c_str(), session.environment.out);
      return;
    }
    body.set(QVDMatchesKey, std::move(forms));
  }
  printReply(session, body);
}

}  // namespace

int runQueryCommand(const Session& session) {
  const Invocation& invocation = session.invocation;
  QVDaemonClient& client = session.client;
  Result<Value> reply = awaitReply([&](QVDReplyHandler done) {
    switch (invocation.command) {
      case Command::Match:
        client.matchPlugIns(invocation.rules, invocation.flags, std::move(done));
        break;
      case Command::Find:
        if (invocation.findUuid) {
          client.findPlugInByUUID(*invocation.findUuid, std::move(done));
        } else {
          client.findPlugInByPathURL(invocation.findUrl, std::move(done));
        }
        break;
      case Command::Ready:
        client.readyPlugIns(invocation.plugIns, invocation.sending, invocation.flags,
                            invocation.environment, std::move(done));
        break;
      default:
        client.accessPlugIns(invocation.plugIns, invocation.sending, invocation.flags,
                             std::move(done));
        break;
    }
  });
  std::optional<Dictionary> body = successfulReply(reply, session.environment.err);
  if (!body) return kExitError;
  if (invocation.command == Command::Match || invocation.command == Command::Find) {
    printForms(session, std::move(*body));
  } else {
    printReply(session, *body);
  }
  return kExitOk;
}

}  // namespace qvctl::internal
