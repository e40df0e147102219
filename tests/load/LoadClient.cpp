#include "tests/load/LoadClient.h"

#include <sys/mman.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <set>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "tests/load/FrameClient.h"

namespace qvd::load {

using namespace std::chrono_literals;
using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

// Long enough for the slowest request under full load; a request without a
// reply by then counts as unanswered.
constexpr auto kReplyLimit = 30s;

Dictionary request(std::string_view name) {
  return Dictionary{{std::string(QVDRequestKey), std::string(name)},
                    {std::string(QVDVersionKey), QVDProtocolVersion}};
}

// The error a reply reports, or "" for a success.
std::string errorIn(const Value& reply) {
  const Dictionary* body = reply.dictionary();
  if (body == nullptr) return "reply is no dictionary: " + reply.description();
  const std::uint64_t code = body->get(QVDErrorCodeKey).uint64().value_or(0);
  const std::string* text = body->get(QVDErrorKey).string();
  if (code == 0 && text == nullptr) return "";
  return "error " + std::to_string(code) + ": " + (text ? *text : std::string("(no text)"));
}

std::string formMismatch(const PlugInEntry& entry, const Value& form) {
  const Dictionary* fields = form.dictionary();
  if (fields == nullptr) return "no form: " + form.description();
  const std::string* uuid = fields->get(QVFormUUIDKey).string();
  const std::string* identifier = fields->get(QVFormIdentifierKey).string();
  const std::string* path = fields->get(QVFormPathKey).string();
  if (!uuid || *uuid != entry.uuid.toString())
    return "form of another UUID for " + entry.identifier;
  if (!identifier || *identifier != entry.identifier)
    return "form of another plug-in for " + entry.identifier;
  if (!path || *path != entry.formPath) return "form with another path for " + entry.identifier;
  return "";
}

}  // namespace

const char* requestKindName(RequestKind kind) {
  switch (kind) {
    case RequestKind::FindByUuid:
      return "find by UUID";
    case RequestKind::FindByPath:
      return "find by path";
    case RequestKind::MatchPoint:
      return "match on a point";
    case RequestKind::MatchAll:
      return "match without rules";
    case RequestKind::Annotate:
      return "annotate";
  }
  return "?";
}

RequestKind pickKind(std::mt19937& random) {
  const int roll = std::uniform_int_distribution<int>(0, 99)(random);
  if (roll < 35) return RequestKind::FindByUuid;
  if (roll < 60) return RequestKind::FindByPath;
  if (roll < 82) return RequestKind::MatchPoint;
  if (roll < 97) return RequestKind::MatchAll;
  return RequestKind::Annotate;
}

Dictionary requestBody(RequestKind kind, const Catalogue& catalogue, std::size_t target,
                       int client) {
  const PlugInEntry& entry = catalogue.plugIns[target];
  switch (kind) {
    case RequestKind::FindByUuid: {
      Dictionary body = request(QVDFindRequest);
      body.set(QVDUUIDKey, entry.uuid);
      return body;
    }
    case RequestKind::FindByPath: {
      Dictionary body = request(QVDFindRequest);
      body.set(QVDPathsKey, "file://" + entry.bundlePath);
      return body;
    }
    case RequestKind::MatchPoint: {
      Dictionary body = request(QVDMatchRequest);
      body.set(QVDRulesKey, Dictionary{{std::string(QVProtocolAttribute), entry.point}});
      return body;
    }
    case RequestKind::MatchAll:
      return request(QVDMatchRequest);
    case RequestKind::Annotate: {
      Dictionary body = request(QVDAnnotateRequest);
      body.set(QVDUUIDKey, Array{entry.uuid});
      body.set(QVDAnnotationsKey,
               Dictionary{{std::string(QVAnnotationExtensionKey), Dictionary{{"client", client}}}});
      return body;
    }
  }
  return Dictionary();
}

std::string misanswer(RequestKind kind, const Catalogue& catalogue, std::size_t target,
                      const Value& reply) {
  if (std::string error = errorIn(reply); !error.empty()) return error;
  const Value& matches = reply.dictionary()->get(QVDMatchesKey);
  switch (kind) {
    case RequestKind::FindByUuid:
    case RequestKind::FindByPath:
      return formMismatch(catalogue.plugIns[target], matches);
    case RequestKind::MatchPoint:
    case RequestKind::MatchAll: {
      if (matches.array() == nullptr) return "matches are no list: " + matches.description();
      const std::string* point =
          kind == RequestKind::MatchPoint ? &catalogue.plugIns[target].point : nullptr;
      std::set<std::string> expected, seen;
      for (const PlugInEntry& entry : catalogue.plugIns) {
        if (point == nullptr || entry.point == *point) expected.insert(entry.identifier);
      }
      for (const Value& form : *matches.array()) {
        const Dictionary* fields = form.dictionary();
        const std::string* id = fields ? fields->get(QVFormIdentifierKey).string() : nullptr;
        if (id == nullptr) return "a form without identifier";
        if (!seen.insert(*id).second) return "listed twice: " + *id;
        for (const PlugInEntry& entry : catalogue.plugIns) {
          if (entry.identifier != *id) continue;
          if (std::string wrong = formMismatch(entry, form); !wrong.empty()) return wrong;
        }
      }
      if (seen != expected) {
        return "matched " + std::to_string(seen.size()) + " plug-ins, expected " +
               std::to_string(expected.size());
      }
      return "";
    }
    case RequestKind::Annotate:
      return "";
  }
  return "unknown request kind";
}

Board* mapSharedBoard() {
  void* memory =
      ::mmap(nullptr, sizeof(Board), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  // An anonymous mapping comes zeroed, which is every counter's start.
  return memory == MAP_FAILED ? nullptr : static_cast<Board*>(memory);
}

ClientExit runClient(const std::string& socketPath, const Catalogue& catalogue, int index,
                     int requests, Board& board) {
  std::optional<FrameClient> client = FrameClient::connect(socketPath);
  if (!client) {
    std::fprintf(stderr, "client %d: cannot connect\n", index);
    return kClientNoConnection;
  }
  board.connected.fetch_add(1);
  const auto startLimit = std::chrono::steady_clock::now() + 60s;
  while (board.go.load() == 0) {
    if (std::chrono::steady_clock::now() > startLimit) return kClientNeverStarted;
    std::this_thread::sleep_for(1ms);
  }
  std::mt19937 random(static_cast<unsigned>(index) * 7919u + 17u);
  std::uniform_int_distribution<std::size_t> anyPlugIn(0, catalogue.plugIns.size() - 1);
  for (int n = 0; n < requests; ++n) {
    const RequestKind kind = pickKind(random);
    const std::size_t target = anyPlugIn(random);
    std::optional<Value> reply =
        client->request(Value(requestBody(kind, catalogue, target, index)), kReplyLimit);
    if (!reply) break;
    board.answered[index].fetch_add(1);
    if (std::string wrong = misanswer(kind, catalogue, target, *reply); !wrong.empty()) {
      std::fprintf(stderr, "client %d, request %d (%s): %s\n", index, n + 1, requestKindName(kind),
                   wrong.c_str());
      return kClientWrongAnswer;
    }
  }
  // A second reply to the last request would come right behind the first.
  client->expectSilence(50ms);
  int missing = 0;
  for (std::uint64_t id = 1; id <= static_cast<std::uint64_t>(requests); ++id) {
    missing += client->repliesTo(id) == 0;
  }
  if (client->strayFrames() > 0 || missing > 0) {
    std::fprintf(stderr, "client %d: %d stray frames, %d requests unanswered; first: %s\n", index,
                 client->strayFrames(), missing, client->problem().c_str());
    return client->strayFrames() > 0 ? kClientStrayReply : kClientMissingReply;
  }
  return kClientPassed;
}

}  // namespace qvd::load
