// One client process of the load test: its request mix, what a right answer
// to each request is, and the run itself (connect, wait for the start, send
// every request in turn, waiting for each reply).
#pragma once

#include <atomic>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "platform/values/Value.h"

namespace qvd::load {

// A plug-in of the test root as "find" showed it before the load began.
struct PlugInEntry {
  std::string identifier;
  std::string bundlePath;  // as written; "find" by path sends its file URL
  std::string point;       // its extension point
  platform::Uuid uuid;
  std::string formPath;  // the path its form carries
};

struct Catalogue {
  std::vector<PlugInEntry> plugIns;
  std::vector<std::string> points;
};

// The mix: mostly lookups, a few annotations (each one a file write in the
// daemon, so they stay rare).
enum class RequestKind { FindByUuid, FindByPath, MatchPoint, MatchAll, Annotate };
const char* requestKindName(RequestKind kind);
RequestKind pickKind(std::mt19937& random);

// A request of `kind` about plug-in `target` (or its extension point);
// `client` tells the annotations of one client from another's.
platform::Dictionary requestBody(RequestKind kind, const Catalogue& catalogue, std::size_t target,
                                 int client);
// Why `reply` is not the right answer to that request, or "" when it is.
std::string misanswer(RequestKind kind, const Catalogue& catalogue, std::size_t target,
                      const platform::Value& reply);

// Shared by the parent and every client (an anonymous shared mapping).
struct Board {
  static constexpr int kMaxClients = 1024;
  std::atomic<std::uint32_t> connected;
  std::atomic<std::uint32_t> go;
  std::atomic<std::uint32_t> answered[kMaxClients];  // replies taken, per client
};
static_assert(std::atomic<std::uint32_t>::is_always_lock_free, "shared between processes");
// A zeroed board that forked children share; null when it cannot be mapped.
Board* mapSharedBoard();

// How a client process ends.
enum ClientExit : int {
  kClientPassed = 0,
  kClientMissingReply = 1,
  kClientStrayReply = 2,
  kClientWrongAnswer = 3,
  kClientNoConnection = 4,
  kClientNeverStarted = 5,
};

// The body of a client process: connects to `socketPath`, counts itself in
// `board.connected`, waits for `board.go`, then sends `requests` requests,
// counting each reply in `board.answered[index]`. Reports its first fault
// on stderr.
ClientExit runClient(const std::string& socketPath, const Catalogue& catalogue, int index,
                     int requests, Board& board);

}  // namespace qvd::load
