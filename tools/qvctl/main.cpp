#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "tools/qvctl/Qvctl.h"

int main(int argc, char** argv) {
  // The client library logs each find at the default level, which is
  // chatter on a terminal; errors still show. QV_LOG, when set, decides.
  ::setenv("QV_LOG", "error", /*overwrite=*/0);
  std::vector<std::string_view> args(argv + 1, argv + argc);
  qvctl::Environment environment;
  // A directory that vanished leaves the cwd unknown: relative paths are
  // then refused instead of being resolved against a guess.
  if (char* cwd = ::getcwd(nullptr, 0)) {
    environment.currentDirectory = cwd;
    ::free(cwd);
  }
  return qvctl::runQvctl(args, environment);
}
