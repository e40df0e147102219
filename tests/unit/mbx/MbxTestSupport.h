// Helpers shared by the message-system tests: a temporary platform root,
// frame bytes built by hand, a forked peer that speaks raw bytes, and the
// spawned helper program that speaks through the library.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/mbx/Frame.h"
#include "platform/values/Value.h"

namespace platform::mbx::testing {

using namespace std::chrono_literals;
using Bytes = std::vector<std::uint8_t>;

// Polls `done` until it holds or `limit` passes; answers whether it held.
bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit = 10s);

// A platform root in a new directory under /tmp for one test (also exported
// as QV_ROOT, for the processes it starts); removed afterwards.
class TemporaryRoot {
 public:
  TemporaryRoot();
  ~TemporaryRoot();
  TemporaryRoot(const TemporaryRoot&) = delete;
  TemporaryRoot& operator=(const TemporaryRoot&) = delete;

  const std::string& path() const { return path_; }
  // Where the socket of `service` lives.
  std::string socketPath(const std::string& service) const;

 private:
  std::string path_;
};

// A valid frame with message id `id`.
Bytes frameBytes(FrameKind kind, std::uint64_t id, const Value& body,
                 std::uint64_t inReplyTo = 0);
// A frame with any header at all and `body` (bodyLength taken from the
// header as given, not from `body`).
Bytes rawFrame(const FrameHeader& header, const Bytes& body);
// The CBOR encoding of a value.
Bytes cborOf(const Value& value);
Bytes concat(std::initializer_list<Bytes> parts);

// What a raw peer does after writing its bytes.
enum class RawAfter {
  AwaitEof,              // read (and discard) until the server ends the connection
  ShutdownThenAwaitEof,  // end its own side first, then as AwaitEof
  HoldUntilReleased,     // neither read nor close until release()
};

// A forked child that connects to a socket path, writes prepared bytes and
// then does what `after` says. The child makes only system calls (everything
// is prepared before the fork), so the test's threads do not matter.
class RawPeer {
 public:
  RawPeer(const std::string& socketPath, Bytes bytes, RawAfter after);
  ~RawPeer();
  RawPeer(const RawPeer&) = delete;
  RawPeer& operator=(const RawPeer&) = delete;

  // Lets a HoldUntilReleased child close its connection and exit.
  void release();
  // Waits for the child: 0 when its connection was ended by the server (or
  // it was released), 1 when it could not connect, 2 when it waited for the
  // end in vain (10 s).
  int wait();

  static constexpr int kEndedByServer = 0;

 private:
  pid_t pid_ = -1;
  int releaseFd_ = -1;
  int status_ = -1;
};

// The helper program (MbxTestPeer.cpp), started with posix_spawn so that it
// begins as a fresh process. Its stdin stays open while the object lives.
class PeerProcess {
 public:
  explicit PeerProcess(const std::vector<std::string>& arguments);
  ~PeerProcess();
  PeerProcess(const PeerProcess&) = delete;
  PeerProcess& operator=(const PeerProcess&) = delete;

  pid_t pid() const { return pid_; }
  // Waits for a line on its stdout.
  bool waitForLine(const std::string& line, std::chrono::milliseconds limit = 10s);
  void closeStdin();
  // The exit status, or -1 when it had to be killed after `limit`.
  int wait(std::chrono::milliseconds limit = 10s);

 private:
  pid_t pid_ = -1;
  int stdinFd_ = -1;
  int stdoutFd_ = -1;
  std::string pendingOutput_;
  int status_ = -2;
};

// A thread-safe list of what a handler saw, for checks from the test thread.
class Recorder {
 public:
  void add(std::string entry);
  std::vector<std::string> entries() const;
  std::size_t size() const;
  std::size_t count(const std::string& entry) const;

 private:
  mutable std::mutex mu_;
  std::vector<std::string> entries_;
};

}  // namespace platform::mbx::testing
