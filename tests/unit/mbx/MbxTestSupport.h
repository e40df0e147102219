// Helpers shared by the message-system tests: a temporary platform root,
// frame bytes built by hand, a forked peer that speaks raw bytes, and the
// spawned helper program that speaks through the library.
#pragma once

#include <sys/types.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/cbor/Cbor.h"
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

  const std::string& path() const { return path_; }
  std::string socketPath(const std::string& service) const {
    return path_ + "/run/quorvex/mbx/" + service;
  }

 private:
  std::string path_;
};

// A valid frame with message id `id`.
Bytes frameBytes(FrameKind kind, std::uint64_t id, const Value& body, std::uint64_t inReplyTo = 0);
Bytes concat(std::initializer_list<Bytes> parts);

// Frame bytes built by hand, broken or not; the daemon's hostile-client
// tests use these too, so they are inline and need no library.
inline FrameHeader header(std::uint16_t flags, std::uint64_t id, std::uint32_t length,
                          std::uint64_t inReplyTo = 0) {
  FrameHeader h;
  h.flags = flags;
  h.messageId = id;
  h.inReplyTo = inReplyTo;
  h.bodyLength = length;
  return h;
}
// A frame with any header at all (bodyLength as given, not from `body`).
inline Bytes rawFrame(const FrameHeader& header, const Bytes& body) {
  Bytes frame(kFrameHeaderSize);
  writeHeader(header, std::span<std::uint8_t, kFrameHeaderSize>(frame.data(), kFrameHeaderSize));
  frame.insert(frame.end(), body.begin(), body.end());
  return frame;
}
inline Bytes cborOf(const Value& value) {
  return cbor::encode(value).value();
}

// A forked child that connects to a socket path, writes prepared bytes and
// then does what `after` says: read until the server ends the connection
// (after ending its own side first, with ShutdownThenAwaitEof), or neither
// read nor close until release(). It makes only system calls, so the test's
// threads do not matter.
enum class RawAfter { AwaitEof, ShutdownThenAwaitEof, HoldUntilReleased };
class RawPeer {
 public:
  RawPeer(const std::string& socketPath, Bytes bytes, RawAfter after);
  ~RawPeer() {
    release();
    wait();
  }
  void release();  // lets a HoldUntilReleased child close and exit
  // 0 when the server ended its connection (or it was released), 1 when it
  // could not connect, 2 when it waited for the end in vain (10 s).
  int wait();
  static constexpr int kEndedByServer = 0;

 private:
  pid_t pid_ = -1;
  int releaseFd_ = -1;
  int status_ = -1;
};

// The helper program (MbxTestPeer.cpp), started with posix_spawn so that it
// begins as a fresh process. Its stdin stays open until wait().
class PeerProcess {
 public:
  explicit PeerProcess(const std::vector<std::string>& arguments);
  ~PeerProcess() { wait(); }

  pid_t pid() const { return pid_; }
  // The exit status, or -1 when it had to be killed after 10 s.
  int wait();

 private:
  pid_t pid_ = -1;
  int stdinFd_ = -1;
  int status_ = -2;
};

// A thread-safe list of what a handler saw, for checks from the test thread.
class Recorder {
 public:
  void add(std::string entry) {
    std::lock_guard lock(mu_);
    entries_.push_back(std::move(entry));
  }
  std::vector<std::string> entries() const {
    std::lock_guard lock(mu_);
    return entries_;
  }
  std::size_t size() const { return entries().size(); }
  std::size_t count(const std::string& entry) const {
    auto all = entries();
    return static_cast<std::size_t>(std::count(all.begin(), all.end(), entry));
  }

 private:
  mutable std::mutex mu_;
  std::vector<std::string> entries_;
};

}  // namespace platform::mbx::testing
