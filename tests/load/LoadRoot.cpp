#include "tests/load/LoadRoot.h"

#include <sys/resource.h>

#include <chrono>
#include <fstream>
#include <optional>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "tests/integration/RootContents.h"
#include "tests/load/ProcessFigures.h"

namespace qvd::load {

using namespace std::chrono_literals;
using platform::Value;

::testing::AssertionResult raiseDescriptorLimit(rlim_t atLeast) {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return ::testing::AssertionFailure() << "getrlimit";
  limit.rlim_cur = limit.rlim_max;
  if (::setrlimit(RLIMIT_NOFILE, &limit) != 0) return ::testing::AssertionFailure() << "setrlimit";
  if (limit.rlim_cur < atLeast) {
    return ::testing::AssertionFailure()
           << "descriptor limit " << limit.rlim_cur << " < " << atLeast;
  }
  return ::testing::AssertionSuccess();
}

Catalogue writePlugIns(const integration::TemporaryRoot& root,
                       const std::vector<std::string>& points, int perPoint) {
  Catalogue catalogue;
  catalogue.points = points;
  for (const std::string& point : points) {
    for (int i = 0; i < perPoint; ++i) {
      const std::string name = "load" + std::to_string(catalogue.plugIns.size());
      PlugInEntry entry;
      entry.bundlePath = integration::writeSystemPlugIn(root, name, point);
      entry.identifier = "com.example." + name;
      entry.point = point;
      catalogue.plugIns.push_back(std::move(entry));
    }
  }
  return catalogue;
}

::testing::AssertionResult resolve(FrameClient& client, Catalogue& catalogue) {
  for (std::size_t i = 0; i < catalogue.plugIns.size(); ++i) {
    PlugInEntry& entry = catalogue.plugIns[i];
    std::optional<Value> reply =
        client.request(Value(requestBody(RequestKind::FindByPath, catalogue, i, -1)), 10s);
    const platform::Dictionary* body = reply ? reply->dictionary() : nullptr;
    const platform::Dictionary* form = body ? body->get(QVDMatchesKey).dictionary() : nullptr;
    const std::string* uuid = form ? form->get(QVFormUUIDKey).string() : nullptr;
    const std::string* path = form ? form->get(QVFormPathKey).string() : nullptr;
    std::optional<platform::Uuid> parsed = uuid ? platform::Uuid::parse(*uuid) : std::nullopt;
    if (!parsed || path == nullptr) {
      return ::testing::AssertionFailure() << "no form for " << entry.bundlePath << ": "
                                           << (reply ? reply->description() : client.problem());
    }
    entry.uuid = *parsed;
    entry.formPath = *path;
  }
  return ::testing::AssertionSuccess();
}

::testing::AssertionResult answersEveryKind(FrameClient& client, const Catalogue& catalogue) {
  for (RequestKind kind : {RequestKind::FindByUuid, RequestKind::FindByPath,
                           RequestKind::MatchPoint, RequestKind::MatchAll, RequestKind::Annotate}) {
    std::optional<Value> reply = client.request(Value(requestBody(kind, catalogue, 1, -1)), 10s);
    if (!reply) {
      return ::testing::AssertionFailure() << requestKindName(kind) << ": " << client.problem();
    }
    if (std::string wrong = misanswer(kind, catalogue, 1, *reply); !wrong.empty()) {
      return ::testing::AssertionFailure() << requestKindName(kind) << ": " << wrong;
    }
  }
  return ::testing::AssertionSuccess();
}

Figures settledFigures(pid_t daemon) {
  using Clock = std::chrono::steady_clock;
  const auto limit = Clock::now() + 3s;
  int last = openFdCount(daemon);
  auto stableSince = Clock::now();
  while (Clock::now() < limit && Clock::now() - stableSince < 300ms) {
    std::this_thread::sleep_for(20ms);
    const int now = openFdCount(daemon);
    if (now != last) stableSince = Clock::now();
    last = now;
  }
  return {threadCount(daemon), last};
}

LogScan scanLog(const std::string& path) {
  LogScan scan;
  std::ifstream in(path);
  for (std::string line; std::getline(in, line);) {
    scan.bytes += line.size() + 1;
    const bool fault = line.find("<Fault>") != std::string::npos;
    if (!fault && line.find("<Error>") == std::string::npos) continue;
    (fault ? scan.faults : scan.errors) += 1;
    if (scan.faults + scan.errors <= 3)
      scan.firstFaultsAndErrors += "  " + line.substr(0, 300) + "\n";
  }
  return scan;
}

}  // namespace qvd::load
