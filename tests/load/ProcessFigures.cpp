#include "tests/load/ProcessFigures.h"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>

namespace qvd::load {

namespace fs = std::filesystem;

namespace {

// The fields of /proc/<pid>/stat after the command (which may hold spaces):
// state first, then the parent's pid.
bool readStat(pid_t pid, char& state, pid_t& parent) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string line;
  if (!std::getline(in, line)) return false;
  const std::size_t close = line.rfind(')');
  if (close == std::string::npos) return false;
  std::istringstream rest(line.substr(close + 1));
  return static_cast<bool>(rest >> state >> parent);
}

}  // namespace

pid_t childRunning(const std::string& executable) {
  std::error_code error;
  const fs::path wanted = fs::canonical(executable, error);
  for (const fs::directory_entry& entry : fs::directory_iterator("/proc", error)) {
    const std::string name = entry.path().filename();
    if (name.find_first_not_of("0123456789") != std::string::npos) continue;
    const pid_t pid = static_cast<pid_t>(std::stol(name));
    char state = 0;
    pid_t parent = 0;
    if (!readStat(pid, state, parent) || parent != ::getpid() || state == 'Z') continue;
    std::error_code unreadable;
    if (fs::read_symlink(entry.path() / "exe", unreadable) == wanted) return pid;
  }
  return -1;
}

bool isRunning(pid_t pid) {
  char state = 0;
  pid_t parent = 0;
  return readStat(pid, state, parent) && state != 'Z' && state != 'X';
}

int threadCount(pid_t pid) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(in, line);) {
    if (line.rfind("Threads:", 0) == 0) return std::stoi(line.substr(8));
  }
  return -1;
}

int openFdCount(pid_t pid) {
  std::error_code error;
  int count = 0;
  for (fs::directory_iterator it("/proc/" + std::to_string(pid) + "/fd", error), end;
       !error && it != end; it.increment(error)) {
    ++count;
  }
  return error ? -1 : count;
}

}  // namespace qvd::load
