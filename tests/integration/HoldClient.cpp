// A client that keeps its connection: sends the request in a vmap file (a
// "lock" taking a hold) as often as asked, writes the last reply as vmap
// XML to REPLY.vmap (atomically, so a reader never sees half), then stays
// connected until its standard input ends, and exits 0.
//   qvd_hold_client [--service NAME] [--count N] REQUEST.vmap REPLY.vmap
// Exit: 3 when the connection failed, 2 for a bad command line or file.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "Quorvex/QVDConstants.h"
#include "platform/mbx/Connection.h"
#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Reader.h"

int main(int argc, char** argv) {
  std::string service(QVDServiceName);
  long count = 1;
  std::string files[2];
  int nfiles = 0;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--service" && i + 1 < argc) {
      service = argv[++i];
    } else if (arg == "--count" && i + 1 < argc) {
      count = std::strtol(argv[++i], nullptr, 10);
    } else if (nfiles < 2) {
      files[nfiles++] = arg;
    } else {
      nfiles = 3;
    }
  }
  if (nfiles != 2 || count < 1) {
    std::fprintf(stderr, "usage: qvd_hold_client [--service NAME] [--count N] REQUEST REPLY\n");
    return 2;
  }
  auto request = platform::vmap::readFile(files[0]);
  if (!request.ok()) return 2;
  auto connection = platform::mbx::Connection::connectToService(service);
  if (!connection.ok()) return 3;
  (*connection)->setEventHandler([](const platform::mbx::ConnectionEvent&) {});
  (*connection)->resume();
  platform::Value last;
  for (long i = 0; i < count; ++i) {
    auto reply = (*connection)->sendWithReplySync(*request);
    if (!reply.ok()) return 3;
    last = reply->body();
  }
  if (!platform::vmap::writeFileAtomically(files[1], last, platform::vmap::Format::Xml).ok()) {
    return 2;
  }
  char byte;
  while (::read(STDIN_FILENO, &byte, 1) > 0) {
  }
  (*connection)->cancel();
  return 0;
}
