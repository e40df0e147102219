// A stand-in for a running plug-in: the tests copy this program into a
// plug-in bundle, so that /proc/<pid>/exe lies inside the bundle, and start
// it there.
//   holds_plugin_process [--ignore-term | --linger-on-term] [--assertions DIR]
// --linger-on-term takes 300 ms to die of SIGTERM, as a plug-in saving its
// state would, so that a test can tell whether its caller waited.
// It answers 'R' on stdout once ready, then obeys one-byte commands on
// stdin, answering each with the same byte:
//   b  take the busy assertion: create DIR/<pid> and hold an exclusive flock
//   f  free it: drop the lock, leaving the file behind (a stale assertion)
//   q  exit 0
// It exits 0 at the end of its input, so it never outlives its test.
#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <cstring>
#include <string>

namespace {

bool answer(char byte) {
  return ::write(STDOUT_FILENO, &byte, 1) == 1;
}

void lingerThenDie(int) {
  const struct timespec linger = {0, 300'000'000};
  ::nanosleep(&linger, nullptr);
  struct sigaction fallback {};
  fallback.sa_handler = SIG_DFL;
  ::sigaction(SIGTERM, &fallback, nullptr);
  ::raise(SIGTERM);
}

// mkdir -p: the assertion directory of a bundle is made by its first
// instance.
void makeDirectories(const std::string& path) {
  for (std::size_t slash = path.find('/', 1); slash != std::string::npos;
       slash = path.find('/', slash + 1)) {
    ::mkdir(path.substr(0, slash).c_str(), 0755);
  }
  ::mkdir(path.c_str(), 0755);
}

}  // namespace

int main(int argc, char** argv) {
  std::string assertions;
  for (int i = 1; i < argc; ++i) {
    if (std::strcmp(argv[i], "--ignore-term") == 0) {
      ::signal(SIGTERM, SIG_IGN);
    } else if (std::strcmp(argv[i], "--linger-on-term") == 0) {
      struct sigaction linger {};
      linger.sa_handler = lingerThenDie;
      ::sigaction(SIGTERM, &linger, nullptr);
    } else if (std::strcmp(argv[i], "--assertions") == 0 && i + 1 < argc) {
      assertions = argv[++i];
    } else {
      return 2;
    }
  }
  int lockFd = -1;
  if (!answer('R')) return 3;
  char command = 0;
  while (::read(STDIN_FILENO, &command, 1) == 1) {
    switch (command) {
      case 'b': {
        if (assertions.empty()) return 4;
        makeDirectories(assertions);
        const std::string path = assertions + "/" + std::to_string(::getpid());
        if (lockFd < 0) lockFd = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
        if (lockFd < 0 || ::flock(lockFd, LOCK_EX) != 0) return 5;
        break;
      }
      case 'f':
        if (lockFd >= 0) ::flock(lockFd, LOCK_UN);
        break;
      case 'q':
        return 0;
      default:
        return 6;
    }
    if (!answer(command)) return 3;
  }
  return 0;
}
