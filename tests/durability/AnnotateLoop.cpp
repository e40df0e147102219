// qvd_annotate_loop FIRST COUNT UUID...
//
// Sets the "extension" annotation {"step": i} of plug-in UUID[i % n] for i
// from FIRST to FIRST + COUNT - 1, one request at a time, as fast as the
// daemon answers. Before each request it prints "sent i", after its success
// "ack i", each line flushed at once, so that whoever kills the daemon knows
// exactly which changes were acknowledged and which one was in flight.
//
// Exit: 0 after the last request, 3 at the first failure (the daemon gone),
// 2 for a bad command line.
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "Quorvex/QVDaemonClient.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"

int main(int argc, char** argv) {
  if (argc < 4) {
    std::fprintf(stderr, "usage: qvd_annotate_loop FIRST COUNT UUID...\n");
    return 2;
  }
  const long first = std::strtol(argv[1], nullptr, 10);
  const long count = std::strtol(argv[2], nullptr, 10);
  std::vector<platform::Uuid> uuids;
  for (int i = 3; i < argc; ++i) {
    std::optional<platform::Uuid> uuid = platform::Uuid::parse(argv[i]);
    if (!uuid) {
      std::fprintf(stderr, "not a UUID: %s\n", argv[i]);
      return 2;
    }
    uuids.push_back(*uuid);
  }
  auto client = QVDaemonClient::initWithServiceName(std::nullopt);
  if (!client.ok()) return 3;
  for (long i = first; i < first + count; ++i) {
    const platform::Uuid& uuid = uuids[static_cast<std::size_t>(i) % uuids.size()];
    std::printf("sent %ld\n", i);
    std::fflush(stdout);
    platform::dispatch::Semaphore answered;
    bool ok = false;
    (*client)->setPluginAnnotations(
        {uuid}, platform::Dictionary{{"extension", platform::Dictionary{{"step", i}}}},
        [&](const platform::Result<platform::Value>& reply) {
          ok = !QVDaemonClient::errorInReply(reply).has_value();
          answered.signal();
        });
    answered.wait();
    if (!ok) return 3;
    std::printf("ack %ld\n", i);
    std::fflush(stdout);
  }
  return 0;
}
