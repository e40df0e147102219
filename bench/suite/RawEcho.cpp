// The raw Unix-socket peer and the private bus's dbus-daemon (which needs
// no libdbus on this side: it is a program that prints its address).
#include <errno.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>

#include "bench/suite/EchoPeers.h"

namespace bench::suite {
namespace {

sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  return address;
}

bool readAll(int fd, char* data, std::size_t size) {
  std::size_t have = 0;
  while (have < size) {
    const ssize_t n = ::read(fd, data + have, size - have);
    if (n <= 0) return false;
    have += static_cast<std::size_t>(n);
  }
  return true;
}

bool writeAll(int fd, const char* data, std::size_t size) {
  std::size_t done = 0;
  while (done < size) {
    const ssize_t n = ::write(fd, data + done, size - done);
    if (n <= 0) return false;
    done += static_cast<std::size_t>(n);
  }
  return true;
}

}  // namespace

int runRawEcho(const std::string& path, std::size_t requestBytes, std::size_t replyBytes) {
  const int listenFd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const sockaddr_un address = addressOf(path);
  if (::bind(listenFd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listenFd, 1) != 0) {
    std::perror(path.c_str());
    return 1;
  }
  std::printf("ready\n");
  std::fflush(stdout);
  const int fd = ::accept(listenFd, nullptr, nullptr);
  std::vector<char> request(requestBytes);
  const std::vector<char> reply(replyBytes, 'y');
  while (readAll(fd, request.data(), request.size()) &&
         writeAll(fd, reply.data(), reply.size())) {
  }
  return 0;
}

platform::Result<std::unique_ptr<RawPingPong>> RawPingPong::connect(const std::string& path,
                                                                    std::size_t requestBytes,
                                                                    std::size_t replyBytes) {
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const sockaddr_un address = addressOf(path);
  if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    const int err = errno;
    ::close(fd);
    return platform::Error::posix(err, "connect " + path);
  }
  return std::unique_ptr<RawPingPong>(new RawPingPong(fd, requestBytes, replyBytes));
}

RawPingPong::~RawPingPong() {
  ::close(fd_);
}

bool RawPingPong::once() {
  return writeAll(fd_, request_.data(), request_.size()) &&
         readAll(fd_, reply_.data(), reply_.size());
}

platform::Result<std::unique_ptr<PrivateBus>> PrivateBus::start(const std::string& directory) {
  const std::string config = directory + "/bus.conf";
  {
    std::ofstream out(config);
    out << "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN\"\n"
           " \"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
           "<busconfig>\n"
           "  <type>session</type>\n"
           "  <listen>unix:path=" << directory << "/bus</listen>\n"
           "  <auth>EXTERNAL</auth>\n"
           "  <policy context=\"default\">\n"
           "    <allow send_destination=\"*\" eavesdrop=\"true\"/>\n"
           "    <allow eavesdrop=\"true\"/>\n"
           "    <allow own=\"*\"/>\n"
           "  </policy>\n"
           "</busconfig>\n";
    if (!out) return platform::Error::posix(EIO, "write " + config);
  }
  // Its log (it says, for one, that it may not raise its descriptor limit
  // as a session bus would) stays beside the configuration.
  auto daemon = Helper::start(
      {"dbus-daemon", "--config-file=" + config, "--nofork", "--print-address=1"},
      directory + "/dbus-daemon.log");
  if (!daemon.ok()) return daemon.error();
  std::optional<std::string> address = (*daemon)->readLine(10);
  if (!address || address->empty()) {
    return platform::Error::posix(EIO, "dbus-daemon printed no address");
  }
  return std::unique_ptr<PrivateBus>(new PrivateBus(std::move(*daemon), *address));
}

}  // namespace bench::suite
