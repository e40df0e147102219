#include "platform/mbx/identity/internal/IdentityTaker.h"

#include <unistd.h>

#include <cerrno>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/mbx/identity/internal/ClockTicks.h"
#include "platform/mbx/identity/internal/Pidfd.h"
#include "platform/mbx/identity/internal/ProcDir.h"
#include "platform/mbx/identity/internal/SocketPeer.h"

namespace platform::mbx::internal {
namespace {

Error exited(pid_t pid) {
  return identityError(IdentityErrorCode::PeerExited,
                       "peer " + std::to_string(pid) + " exited before its identity was taken");
}

bool isGoneErrno(const Error& error) {
  return error.domain() == kPosixErrorDomain && (error.code() == ENOENT || error.code() == ESRCH);
}

// A read that failed because the process went away says so, whatever the
// call reported; other failures are passed on as they are.
Error settle(Error error, pid_t pid, const UniqueFd& pidfd) {
  if (pidfd.valid()) {
    return livenessOf(pidfd.get()) == Liveness::Exited ? exited(pid) : std::move(error);
  }
  return isGoneErrno(error) ? exited(pid) : std::move(error);
}

std::uint64_t seen(const IdentityTestHooks& hooks, StartTimeRead read, std::uint64_t value) {
  return hooks.startTime ? hooks.startTime(read, value) : value;
}

}  // namespace

IdentityTaker::Taken IdentityTaker::fromSocket(int connectedFd, const IdentityTestHooks& hooks) {
  Subject subject;
  Result<std::uint64_t> now = clockTicksSinceBoot();
  if (!now) return now.error();
  subject.notAfter = *now;

  Result<PeerCredentials> credentials = peerCredentials(connectedFd);
  if (!credentials) return credentials.error();
  subject.pid = credentials->pid;
  subject.uid = credentials->uid;
  subject.gid = credentials->gid;
  if (subject.pid <= 0) {
    return identityError(
        IdentityErrorCode::PeerNotVisible,
        "the kernel names no pid for the peer: the socket is not connected, or the peer "
        "is in a pid namespace this process cannot see");
  }

  if (hooks.pidfdSource == PidfdSource::Automatic) {
    Result<UniqueFd> pidfd = peerPidfd(connectedFd);
    if (!pidfd) return isGoneErrno(pidfd.error()) ? exited(subject.pid) : pidfd.error();
    subject.pidfd = std::move(*pidfd);
  }

  Result<std::string> label = peerSecurityLabel(connectedFd);
  if (!label) return label.error();
  subject.securityLabel = std::move(*label);
  return take(std::move(subject), hooks);
}

IdentityTaker::Taken IdentityTaker::ofSelf() {
  Subject subject;
  Result<std::uint64_t> now = clockTicksSinceBoot();
  if (!now) return now.error();
  subject.notAfter = *now;
  subject.pid = ::getpid();
  subject.uid = ::geteuid();
  subject.gid = ::getegid();
  Result<UniqueFd> pidfd = openPidfd(subject.pid);
  if (!pidfd) return pidfd.error();
  subject.pidfd = std::move(*pidfd);
  return take(std::move(subject), IdentityTestHooks{});
}

IdentityTaker::Taken IdentityTaker::take(Subject subject, const IdentityTestHooks& hooks) {
  const pid_t pid = subject.pid;
  UniqueFd& pidfd = subject.pidfd;

  Result<ProcDir> dir = ProcDir::open(pid);
  if (!dir) return settle(dir.error(), pid, pidfd);
  Result<ProcStat> first = dir->readStat();
  if (!first) return settle(first.error(), pid, pidfd);
  const std::uint64_t startTime = seen(hooks, StartTimeRead::First, first->startTime);
  if (startTime > subject.notAfter) {
    return identityError(IdentityErrorCode::PidReused,
                         "pid " + std::to_string(pid) +
                             " names a process that started after the connection was accepted");
  }
  if (!pidfd.valid()) {
    // No pidfd from the kernel: pin whoever holds the pid now. The start
    // time check above and the liveness check below make sure that this is
    // the process the directory names and that it was there at the accept.
    Result<UniqueFd> opened = openPidfd(pid);
    if (!opened) return isGoneErrno(opened.error()) ? exited(pid) : opened.error();
    pidfd = std::move(*opened);
  }

  // The executable is stat'ed before and after everything else: a peer that
  // runs another program in between shows a different file.
  Result<FileKey> executable = dir->statExecutable();
  if (!executable) return settle(executable.error(), pid, pidfd);
  Result<ExecutableFacts> path = dir->readExecutable(*executable);
  if (!path) return settle(path.error(), pid, pidfd);
  Result<ProcStatusFacts> status = dir->readStatus();
  if (!status) return settle(status.error(), pid, pidfd);
  Result<std::uint64_t> mountNamespace = dir->readMountNamespace();
  if (!mountNamespace) return settle(mountNamespace.error(), pid, pidfd);
  if (!subject.securityLabel) {
    Result<std::string> label = dir->readSecurityLabel();
    if (!label) return settle(label.error(), pid, pidfd);
    subject.securityLabel = std::move(*label);
  }

  if (hooks.betweenReads) hooks.betweenReads(pid);

  Result<ProcStat> second = dir->readStat();
  if (!second) return settle(second.error(), pid, pidfd);
  if (seen(hooks, StartTimeRead::Second, second->startTime) != startTime) {
    return identityError(
        IdentityErrorCode::StartTimeMismatch,
        "the start time of pid " + std::to_string(pid) + " changed while its identity was taken");
  }
  Result<FileKey> executableAgain = dir->statExecutable();
  if (!executableAgain) return settle(executableAgain.error(), pid, pidfd);
  if (!(*executableAgain == *executable)) {
    return identityError(
        IdentityErrorCode::ExecutableChanged,
        "peer " + std::to_string(pid) + " ran another program while its identity was taken");
  }
  // The pinned process must be the one the directory shows: the same number
  // in the same /proc.
  Result<pid_t> pinned = pidOfPidfd(pidfd.get());
  if (!pinned) return settle(pinned.error(), pid, pidfd);
  if (*pinned != pid) {
    if (livenessOf(pidfd.get()) == Liveness::Exited) return exited(pid);
    return identityError(IdentityErrorCode::PidfdMismatch,
                         "the pidfd of peer " + std::to_string(pid) + " names pid " +
                             std::to_string(*pinned) + " in /proc");
  }
  // Last: everything above was read while the process was still this one.
  if (livenessOf(pidfd.get()) == Liveness::Exited || second->state == 'Z' || second->state == 'X') {
    return exited(pid);
  }

  std::shared_ptr<PeerIdentity> identity(new PeerIdentity());
  identity->pid_ = pid;
  identity->uid_ = subject.uid;
  identity->gid_ = subject.gid;
  identity->startTime_ = startTime;
  identity->executablePath_ = std::move(path->path);
  identity->executableDevice_ = executable->device;
  identity->executableInode_ = executable->inode;
  identity->executableWasReplaced_ = path->replaced;
  identity->confinement_.seccompMode = status->seccompMode;
  identity->confinement_.noNewPrivs = status->noNewPrivs;
  identity->confinement_.securityLabel = std::move(*subject.securityLabel);
  identity->confinement_.mountNamespace = *mountNamespace;
  return std::shared_ptr<const PeerIdentity>(std::move(identity));
}

}  // namespace platform::mbx::internal
