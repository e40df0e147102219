// A client for the identity tests: connects to the socket named by argv[1],
// confines itself as argv[3] says, answers one byte ('R' ready, 'F' it
// failed), then obeys one-byte commands: 'e' runs argv[2] keeping the
// connection, 'q' or end of input exits.
//
//   identity_peer SOCKET EXEC_TARGET plain|nnp|seccomp
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <string>

int main(int argc, char** argv) {
  if (argc < 4) return 2;
  // Not close-on-exec: the program run on 'e' keeps the connection.
  const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  struct sockaddr_un address {};
  address.sun_family = AF_UNIX;
  if (fd < 0 || ::strlen(argv[1]) >= sizeof address.sun_path) return 2;
  ::strcpy(address.sun_path, argv[1]);
  if (::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) return 2;
  const std::string mode = argv[3];
  struct sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
  struct sock_fprog program = {1, &allow};  // a filter that allows everything
  const bool ok =
      mode == "plain" ||
      (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
       (mode == "nnp" || ::syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &program) == 0));
  const char reply = ok ? 'R' : 'F';
  if (::write(fd, &reply, 1) != 1) return 2;
  for (char command = 0; ::read(fd, &command, 1) == 1 && command != 'q';) {
    if (command == 'e') {
      const std::string fdText = std::to_string(fd);
      ::execl(argv[2], argv[2], fdText.c_str(), static_cast<char*>(nullptr));
      return 3;
    }
  }
  return 0;
}
