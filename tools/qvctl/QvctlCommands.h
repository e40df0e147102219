// The command families of qvctl and what they share: waiting for a reply,
// checking it, printing it. Each family runs its requests through the
// client library and returns the exit status.
//
// Thread safety: a session belongs to the one thread running runQvctl.
#pragma once

#include <cstdio>
#include <functional>
#include <optional>

#include "Quorvex/QVDaemonClient.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "tools/qvctl/Qvctl.h"
#include "tools/qvctl/QvctlArguments.h"

namespace qvctl::internal {

struct Session {
  const Invocation& invocation;
  QVDaemonClient& client;
  const Environment& environment;
};

// Sends through `start` and waits for the reply, whichever way it comes.
platform::Result<platform::Value> awaitReply(const std::function<void(QVDReplyHandler)>& start);

// The body of a successful reply. For an error reply, or a daemon that
// broke the protocol, reports it on the error stream and answers none.
std::optional<platform::Dictionary> successfulReply(const platform::Result<platform::Value>& reply,
                                                    std::FILE* err);

// Everything but the error keys, human-readable; the whole body with --json.
void printReply(const Session& session, const platform::Dictionary& body);

// add, remove, bulk, hold, release.
int runPlugInCommand(const Session& session);
// match, find, ready, access.
int runQueryCommand(const Session& session);
// annotate, bulk-annotate.
int runAnnotationCommand(const Session& session);
// watch: needs no daemon connection.
int runWatch(const Invocation& invocation, const Environment& environment);

}  // namespace qvctl::internal
