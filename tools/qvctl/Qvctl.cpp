#include "tools/qvctl/Qvctl.h"

#include <memory>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVInternalInconsistencyException.h"
#include "platform/dispatch/Semaphore.h"
#include "tools/qvctl/QvctlArguments.h"
#include "tools/qvctl/QvctlCommands.h"
#include "tools/qvctl/QvctlHelp.h"
#include "tools/qvctl/QvctlOutput.h"

namespace qvctl {

using platform::Dictionary;
using platform::Result;
using platform::Value;

namespace internal {

Result<Value> awaitReply(const std::function<void(QVDReplyHandler)>& start) {
  struct Outcome {
    platform::dispatch::Semaphore arrived;
    std::optional<Result<Value>> reply;
  };
  auto outcome = std::make_shared<Outcome>();
  start([outcome](const Result<Value>& reply) {
    outcome->reply.emplace(reply);
    outcome->arrived.signal();
  });
  outcome->arrived.wait();
  return std::move(*outcome->reply);
}

std::optional<Dictionary> successfulReply(const Result<Value>& reply, std::FILE* err) {
  std::optional<platform::Error> error;
  try {
    error = QVDaemonClient::errorInReply(reply);
  } catch (const QVInternalInconsistencyException& broken) {
    std::fprintf(err, "qvctl: %s\n", broken.what());
    return std::nullopt;
  }
  if (error) {
    std::fprintf(err, "qvctl: error %lld: %s\n", static_cast<long long>(error->code()),
                 error->description().c_str());
    return std::nullopt;
  }
  return *reply.value().dictionary();
}

void printReply(const Session& session, const Dictionary& body) {
  if (session.invocation.format == OutputFormat::Json) {
    std::fputs(formatJson(body).c_str(), session.environment.out);
    return;
  }
  Dictionary shown = body;
  shown.remove(QVDErrorCodeKey);
  shown.remove(QVDErrorKey);
  if (!shown.empty()) std::fputs(formatHuman(shown).c_str(), session.environment.out);
}

}  // namespace internal

namespace {

int usageFailure(const std::string& message, std::optional<Command> command, std::FILE* err) {
  std::fprintf(err, "qvctl: %s\n", message.c_str());
  if (command && *command != Command::Help) {
    std::fprintf(err, "usage: qvctl %s\nRun 'qvctl help %s' for more.\n",
                 std::string(commandInfo(*command).usage).c_str(),
                 std::string(commandInfo(*command).name).c_str());
  } else {
    std::fputs(
        "usage: qvctl [--service NAME] [--json] COMMAND [ARGUMENTS]\n"
        "Run 'qvctl --help' for the commands.\n",
        err);
  }
  return kExitUsage;
}

// The command named in `args`, for the usage message of a failed parse.
std::optional<Command> commandIn(std::span<const std::string_view> args) {
  for (std::string_view arg : args) {
    if (const CommandInfo* info = commandNamed(arg)) return info->command;
  }
  return std::nullopt;
}

}  // namespace

int runQvctl(std::span<const std::string_view> args, const Environment& environment) {
  Result<Invocation> parsed = parseArguments(args, environment.currentDirectory);
  if (!parsed.ok())
    return usageFailure(parsed.error().description(), commandIn(args), environment.err);
  const Invocation& invocation = parsed.value();
  switch (invocation.command) {
    case Command::Help:
      std::fputs(
          (invocation.helpTopic ? commandHelp(*invocation.helpTopic) : overviewHelp()).c_str(),
          environment.out);
      return kExitOk;
    case Command::Watch:
      return internal::runWatch(invocation, environment);
    default:
      break;
  }
  Result<std::shared_ptr<QVDaemonClient>> client = QVDaemonClient::initWithServiceName(
      invocation.service ? std::optional<std::string_view>(*invocation.service) : std::nullopt);
  if (!client.ok()) {
    return usageFailure("--service: " + client.error().description(), std::nullopt,
                        environment.err);
  }
  const internal::Session session{invocation, *client.value(), environment};
  switch (invocation.command) {
    case Command::Add:
    case Command::Remove:
    case Command::Bulk:
    case Command::Hold:
    case Command::Release:
      return internal::runPlugInCommand(session);
    case Command::Match:
    case Command::Find:
    case Command::Ready:
    case Command::Access:
      return internal::runQueryCommand(session);
    case Command::Annotate:
    case Command::BulkAnnotate:
      return internal::runAnnotationCommand(session);
    case Command::Help:
    case Command::Watch:
      break;
  }
  return kExitOk;
}

}  // namespace qvctl
