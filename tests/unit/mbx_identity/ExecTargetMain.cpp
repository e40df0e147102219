// The second program of the exec-after-connect tests: announces itself with
// 'X' on the connection it inherited (fd in argv[1]), then waits for 'q' or
// the end of input.
#include <unistd.h>

#include <cstdlib>

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  const int fd = std::atoi(argv[1]);
  const char hello = 'X';
  if (::write(fd, &hello, 1) != 1) return 2;
  char command = 0;
  while (::read(fd, &command, 1) == 1 && command != 'q') {
  }
  return 0;
}
