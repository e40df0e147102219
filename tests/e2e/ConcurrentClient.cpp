// The two sides of the end-to-end concurrency test, as client processes of
// their own that share a small "board" file (mapped by every process):
//
//   qvd_e2e_concurrent_client match --board FILE --point ID --held ID [--expect ID]...
//     A host: matches the extension point in a loop until the board says
//     stop, and judges each reply against the hold phase it ran in.
//   qvd_e2e_concurrent_client hold --board FILE --path BUNDLE --cycles N --hosts K
//     An installer: once K hosts have matched, takes a hold on the bundle
//     and releases it by token N times, publishing each step, then says stop.
//
// The phase is a counter the installer moves: 4k+1 before it sends a hold,
// 4k+2 once the hold is acknowledged, 4k+3 before it sends the release, 4k+4
// once that is acknowledged. A match whose phase was the same before it was
// sent and after its reply came ran entirely inside one state: held (the
// plug-in must be absent) or free (it must be there). Any other match may
// see either.
//
// Each prints one line of counts on stdout, the first failures on stderr.
// Exit: 0 after the loop (the counts tell the verdict), 2 for a bad command
// line or board, 3 without a daemon, 4 when the hosts never became ready.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <map>
#include <random>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVInternalInconsistencyException.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"

namespace {

using platform::Dictionary;
using platform::Result;
using platform::Uuid;
using platform::Value;
using namespace std::chrono_literals;

struct Board {
  std::atomic<std::uint64_t> phase;
  std::atomic<std::uint32_t> readyHosts;
  std::atomic<std::uint32_t> stop;
};
static_assert(std::atomic<std::uint64_t>::is_always_lock_free, "shared between processes");

Board* mapBoard(const std::string& path) {
  const int fd = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
  if (fd < 0) return nullptr;
  void* memory = ::mmap(nullptr, sizeof(Board), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  ::close(fd);
  return memory == MAP_FAILED ? nullptr : static_cast<Board*>(memory);
}

struct Options {
  std::string mode, board, point, held, path;
  std::vector<std::string> expected;
  long cycles = 0, hosts = 0;
};

// The reply of one request sent the way the client library's caller gets
// it: on the reply queue, waited for here.
Result<Value> await(const std::function<void(QVDReplyHandler)>& send) {
  auto promise = std::make_shared<std::promise<Result<Value>>>();
  std::future<Result<Value>> reply = promise->get_future();
  send([promise](const Result<Value>& r) { promise->set_value(r); });
  return reply.get();
}

// Why a reply is not an answer to "match", or "" when it is one; `seen` gets
// the identifier and UUID of every form.
std::string malformation(const QVDaemonClient& client, const Result<Value>& reply,
                         std::map<std::string, std::string>& seen) {
  try {
    if (auto error = QVDaemonClient::errorInReply(reply)) return "error " + error->description();
  } catch (const QVInternalInconsistencyException& broken) {
    return broken.what();
  }
  const Value* wire = reply.value().dictionary()->find(QVDMatchesKey);
  if (wire == nullptr) return "no matches";
  const Value forms = client.convertFromMBX(*wire);
  if (forms.array() == nullptr) return "matches are no list: " + forms.description();
  for (const Value& form : *forms.array()) {
    const Dictionary* fields = form.dictionary();
    const std::string* id = fields ? fields->get(QVFormIdentifierKey).string() : nullptr;
    const std::string* uuid = fields ? fields->get(QVFormUUIDKey).string() : nullptr;
    const std::string* path = fields ? fields->get(QVFormPathKey).string() : nullptr;
    if (!id || !uuid || !Uuid::parse(*uuid) || !path || !path->starts_with("/")) {
      return "incomplete form: " + form.description();
    }
    if (!seen.emplace(*id, *uuid).second) return "listed twice: " + *id;
  }
  return "";
}

int matchLoop(const Options& options, Board& board) {
  auto client = QVDaemonClient::initWithServiceName(std::nullopt);
  if (!client.ok()) return 3;
  const std::set<std::string> always(options.expected.begin(), options.expected.end());
  std::set<std::string> withHeld = always;
  withHeld.insert(options.held);
  std::map<std::string, std::string> uuids;  // each plug-in keeps its UUID throughout
  long matches = 0, heldChecks = 0, freeChecks = 0, either = 0, failures = 0, errors = 0;
  long reported = 0;
  auto fail = [&](long& counter, const std::string& why) {
    ++counter;
    if (++reported <= 5) std::fprintf(stderr, "match %ld: %s\n", matches, why.c_str());
  };
  const auto giveUp = std::chrono::steady_clock::now() + 40s;
  while (board.stop.load() == 0 && std::chrono::steady_clock::now() < giveUp) {
    const std::uint64_t before = board.phase.load();
    const Result<Value> reply = await([&](QVDReplyHandler handler) {
      (*client)->matchPlugIns(Dictionary{{std::string(QVProtocolAttribute), options.point}},
                              QVDiscoverSynchronous, std::move(handler));
    });
    const std::uint64_t after = board.phase.load();
    ++matches;
    std::map<std::string, std::string> seen;
    if (std::string why = malformation(**client, reply, seen); !why.empty()) {
      fail(errors, why);
      continue;
    }
    if (matches == 1) board.readyHosts.fetch_add(1);
    std::set<std::string> ids;
    for (const auto& [id, uuid] : seen) {
      ids.insert(id);
      if (uuids.emplace(id, uuid).first->second != uuid) fail(failures, id + " changed UUID");
    }
    std::string shown;
    for (const std::string& id : ids) shown += " " + id;
    const bool stable = before == after;
    if (stable && before % 4 == 2) {
      ++heldChecks;
      if (ids != always) fail(failures, "phase " + std::to_string(before) + " (held):" + shown);
    } else if (stable && before % 4 == 0) {
      ++freeChecks;
      if (ids != withHeld) fail(failures, "phase " + std::to_string(before) + " (free):" + shown);
    } else {
      ++either;
      if (ids != always && ids != withHeld) {
        fail(failures,
             "phases " + std::to_string(before) + "-" + std::to_string(after) + ":" + shown);
      }
    }
  }
  std::printf("matches=%ld held=%ld free=%ld either=%ld failures=%ld errors=%ld\n", matches,
              heldChecks, freeChecks, either, failures, errors);
  return 0;
}

// The token of a granted hold.
std::optional<Uuid> tokenIn(const Result<Value>& reply) {
  const Dictionary* body = reply.ok() ? reply.value().dictionary() : nullptr;
  const Value* token = body ? body->find(QVDUUIDKey) : nullptr;
  return token ? token->uuid() : std::nullopt;
}

int holdLoop(const Options& options, Board& board) {
  auto client = QVDaemonClient::initWithServiceName(std::nullopt);
  if (!client.ok()) return 3;
  const auto deadline = std::chrono::steady_clock::now() + 10s;
  while (board.readyHosts.load() < static_cast<std::uint32_t>(options.hosts)) {
    if (std::chrono::steady_clock::now() > deadline) {
      board.stop.store(1);
      return 4;
    }
    std::this_thread::sleep_for(1ms);
  }
  std::mt19937 random(static_cast<unsigned>(::getpid()));
  auto pause = [&](int low, int high) {
    std::this_thread::sleep_for(
        std::chrono::milliseconds(std::uniform_int_distribution<int>(low, high)(random)));
  };
  long failures = 0;
  // Whether the request failed (then reported); a granted hold's reply
  // carries its token.
  auto failed = [&](const char* what, const Result<Value>& reply, bool wantsToken) {
    const std::optional<platform::Error> error = QVDaemonClient::errorInReply(reply);
    if (!error && (!wantsToken || tokenIn(reply))) return false;
    if (++failures <= 5) {
      std::fprintf(stderr, "%s: %s\n", what,
                   error ? error->description().c_str() : "no token in the reply");
    }
    return true;
  };
  for (long cycle = 0; cycle < options.cycles; ++cycle) {
    // Every other hold also ends the plug-in's processes first, as an
    // installer replacing a running plug-in would.
    const std::uint64_t flags = cycle % 2 ? 0x5 : 0x1;
    board.phase.store(4 * cycle + 1);
    const Result<Value> held = await([&](QVDReplyHandler handler) {
      (*client)->holdPlugins({options.path}, flags, std::move(handler));
    });
    const bool refused = failed("hold", held, true);
    board.phase.store(4 * cycle + 2);
    pause(15, 50);
    board.phase.store(4 * cycle + 3);
    if (!refused) {
      const Uuid token = *tokenIn(held);
      failed("release", await([&](QVDReplyHandler handler) {
               (*client)->releaseHold(token, std::move(handler));
             }),
             false);
    }
    board.phase.store(4 * cycle + 4);
    pause(5, 25);
  }
  board.stop.store(1);
  std::printf("cycles=%ld failures=%ld\n", options.cycles, failures);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  if (argc > 1) options.mode = argv[1];
  for (int i = 2; i + 1 < argc; i += 2) {
    const std::string key = argv[i], value = argv[i + 1];
    if (key == "--board")
      options.board = value;
    else if (key == "--point")
      options.point = value;
    else if (key == "--held")
      options.held = value;
    else if (key == "--expect")
      options.expected.push_back(value);
    else if (key == "--path")
      options.path = value;
    else if (key == "--cycles")
      options.cycles = std::atol(value.c_str());
    else if (key == "--hosts")
      options.hosts = std::atol(value.c_str());
    else
      return 2;
  }
  Board* board = options.board.empty() ? nullptr : mapBoard(options.board);
  if (board == nullptr) return 2;
  if (options.mode == "match" && !options.point.empty() && !options.held.empty()) {
    return matchLoop(options, *board);
  }
  if (options.mode == "hold" && !options.path.empty() && options.cycles > 0) {
    return holdLoop(options, *board);
  }
  std::fprintf(stderr, "usage: see the comment at the top of ConcurrentClient.cpp\n");
  return 2;
}
