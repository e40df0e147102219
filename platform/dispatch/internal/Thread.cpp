#include "platform/dispatch/internal/Thread.h"

#include <pthread.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstring>

#include "platform/dispatch/internal/Fatal.h"

namespace platform::dispatch::internal {
namespace {

struct Start {
  std::string name;
  Closure body;
};

void* threadMain(void* arg) {
  Start* start = static_cast<Start*>(arg);
  pthread_setname_np(pthread_self(), start->name.substr(0, 15).c_str());
  Closure body = std::move(start->body);
  delete start;
  body();
  return nullptr;
}

}  // namespace

void startDetachedThread(const std::string& name, Closure body) {
  // A new thread inherits the creator's signal mask: block everything around
  // pthread_create so there is no window in which the new thread could take
  // a signal meant for a signalfd.
  sigset_t all;
  sigset_t previous;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &previous);

  pthread_attr_t attr;
  pthread_attr_init(&attr);
  pthread_attr_setdetachstate(&attr, PTHREAD_CREATE_DETACHED);
  auto* start = new Start{name, std::move(body)};
  pthread_t thread;
  int rc = pthread_create(&thread, &attr, &threadMain, start);
  pthread_attr_destroy(&attr);
  pthread_sigmask(SIG_SETMASK, &previous, nullptr);
  if (rc != 0) {
    delete start;
    fatal("cannot start thread '%s': %s", name.c_str(), std::strerror(rc));
  }
}

std::string currentThreadName() {
  char name[32] = {};
  if (pthread_getname_np(pthread_self(), name, sizeof name) != 0) return "?";
  return name;
}

bool isProcessMainThread() {
  return static_cast<pid_t>(syscall(SYS_gettid)) == getpid();
}

}  // namespace platform::dispatch::internal
