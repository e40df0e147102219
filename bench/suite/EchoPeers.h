// What a "find" round trip is set against: the same bytes bounced over a
// plain Unix socket (the floor any local request/reply pays), and a method
// call through a private D-Bus session bus, the usual alternative for a
// service on Linux. Both peers run as helper processes: this binary started
// with --raw-echo or --dbus-echo.
//
// Thread safety: one thread each; the echo loops own their process.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "bench/suite/Suite.h"

namespace bench::suite {

// ---- Raw Unix socket ------------------------------------------------------

// Helper mode: listens on `path`, prints "ready", then for one connection
// reads `requestBytes` and answers `replyBytes`, until the peer goes.
int runRawEcho(const std::string& path, std::size_t requestBytes, std::size_t replyBytes);

// The client side: connected to a runRawEcho helper.
class RawPingPong {
 public:
  static platform::Result<std::unique_ptr<RawPingPong>> connect(const std::string& path,
                                                                std::size_t requestBytes,
                                                                std::size_t replyBytes);
  ~RawPingPong();
  // One request and its reply; false when the peer went away.
  bool once();

 private:
  RawPingPong(int fd, std::size_t requestBytes, std::size_t replyBytes)
      : fd_(fd), request_(requestBytes, 'x'), reply_(replyBytes) {}
  int fd_;
  std::vector<char> request_;
  std::vector<char> reply_;
};

// ---- D-Bus ------------------------------------------------------------------

// Whether this binary was built with libdbus-1.
bool dbusAvailable();

// Helper mode: connects to the bus at `address`, takes the echo service's
// name, prints "ready", and answers every Echo call with `replyBytes` bytes.
int runDBusEcho(const std::string& address, std::size_t replyBytes);

// The caller: a private connection to the bus at `address`.
class DBusCaller {
 public:
  static platform::Result<std::unique_ptr<DBusCaller>> connect(const std::string& address,
                                                               std::size_t requestBytes);
  ~DBusCaller();
  // One method call with the request bytes, waiting for its reply.
  bool once();

 private:
  struct State;
  explicit DBusCaller(std::unique_ptr<State> state);
  std::unique_ptr<State> state_;
};

// A session bus of its own: dbus-daemon with a configuration in `directory`
// that lets anyone own any name, listening on a socket there.
class PrivateBus {
 public:
  static platform::Result<std::unique_ptr<PrivateBus>> start(const std::string& directory);
  const std::string& address() const { return address_; }
  pid_t pid() const { return daemon_->pid(); }

 private:
  PrivateBus(std::unique_ptr<Helper> daemon, std::string address)
      : daemon_(std::move(daemon)), address_(std::move(address)) {}
  std::unique_ptr<Helper> daemon_;
  std::string address_;
};

}  // namespace bench::suite
