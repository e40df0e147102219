// Built instead of DBusEcho.cpp when libdbus-1 is not installed: the D-Bus
// comparison is then reported as not measured.
#include <errno.h>

#include "bench/suite/EchoPeers.h"

namespace bench::suite {

struct DBusCaller::State {};

bool dbusAvailable() {
  return false;
}

int runDBusEcho(const std::string&, std::size_t) {
  return 1;
}

DBusCaller::DBusCaller(std::unique_ptr<State> state) : state_(std::move(state)) {}
DBusCaller::~DBusCaller() = default;

platform::Result<std::unique_ptr<DBusCaller>> DBusCaller::connect(const std::string&,
                                                                  std::size_t) {
  return platform::Error::posix(ENOSYS, "built without libdbus-1");
}

bool DBusCaller::once() {
  return false;
}

}  // namespace bench::suite
