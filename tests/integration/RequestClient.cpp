// Sends the request in a vmap file to the daemon, as often as asked, and
// prints the last reply as vmap XML:
//   qvd_request_client [--service NAME] [--count N] [--memfd] REQUEST.vmap
// --memfd re-runs it from an anonymous memory file, so that the daemon cannot
// find its executable. Exit: 0 with a reply, 3 when the connection failed,
// 2 for a bad command line or request file.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "platform/mbx/Connection.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace {

[[noreturn]] void reexecFromMemfd(std::vector<char*> argv) {
  std::ifstream self("/proc/self/exe", std::ios::binary);
  std::string image((std::istreambuf_iterator<char>(self)), std::istreambuf_iterator<char>());
  int fd = ::memfd_create("qvd-request-client", 0);
  if (fd < 0 || ::write(fd, image.data(), image.size()) != static_cast<ssize_t>(image.size())) {
    std::perror("memfd");
    std::exit(2);
  }
  argv.push_back(nullptr);
  ::fexecve(fd, argv.data(), environ);
  std::perror("fexecve");
  std::exit(2);
}

}  // namespace

int main(int argc, char** argv) {
  std::string service(QVDServiceName);
  long count = 1;
  bool memfd = false;
  std::vector<char*> rest{argv[0]};
  std::string requestFile;
  for (int i = 1; i < argc; ++i) {
    const std::string arg = argv[i];
    if (arg == "--service" && i + 1 < argc) {
      service = argv[++i];
      rest.push_back(argv[i - 1]);
      rest.push_back(argv[i]);
    } else if (arg == "--count" && i + 1 < argc) {
      count = std::strtol(argv[++i], nullptr, 10);
      rest.push_back(argv[i - 1]);
      rest.push_back(argv[i]);
    } else if (arg == "--memfd") {
      memfd = true;
    } else {
      requestFile = arg;
      rest.push_back(argv[i]);
    }
  }
  if (requestFile.empty() || count < 1) {
    std::fprintf(stderr, "usage: qvd_request_client [--service NAME] [--count N] [--memfd] FILE\n");
    return 2;
  }
  if (memfd) reexecFromMemfd(rest);

  auto request = platform::vmap::readFile(requestFile);
  if (!request.ok()) {
    std::fprintf(stderr, "%s\n", request.error().description().c_str());
    return 2;
  }
  auto connection = platform::mbx::Connection::connectToService(service);
  if (!connection.ok()) {
    std::fprintf(stderr, "%s\n", connection.error().description().c_str());
    return 3;
  }
  (*connection)->setEventHandler([](const platform::mbx::ConnectionEvent&) {});
  (*connection)->resume();
  platform::Value last;
  for (long i = 0; i < count; ++i) {
    auto reply = (*connection)->sendWithReplySync(*request);
    if (!reply.ok()) {
      std::fprintf(stderr, "%s\n", reply.error().description().c_str());
      return 3;
    }
    last = reply->body();
  }
  auto text = platform::vmap::write(last, platform::vmap::Format::Xml);
  std::fputs(text.ok() ? text->c_str() : "(unprintable reply)\n", stdout);
  (*connection)->cancel();
  return 0;
}
