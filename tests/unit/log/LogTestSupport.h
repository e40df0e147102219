// Helpers shared by the log tests: a temporary file to send lines to, an
// argument that counts its descriptions, and a fixture that resets the log layer.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <sstream>
#include <string>
#include <vector>

#include "platform/log/LoggerRegistry.h"
#include "platform/log/internal/Output.h"

namespace platform::log::testing {

class TempFile {
 public:
  ~TempFile() { std::fclose(file_); }
  int fd() const { return fileno(file_); }
  // "device:inode", as journald puts it in JOURNAL_STREAM.
  std::string journalStreamValue() const {
    struct stat st {};
    fstat(fd(), &st);
    return std::to_string(st.st_dev) + ":" + std::to_string(st.st_ino);
  }
  std::vector<std::string> lines() const {
    std::string all;
    char buffer[4096];
    for (ssize_t n; (n = pread(fd(), buffer, sizeof buffer, static_cast<off_t>(all.size()))) > 0;)
      all.append(buffer, static_cast<std::size_t>(n));
    std::vector<std::string> out;
    std::istringstream in(all);
    for (std::string line; std::getline(in, line);) out.push_back(line);
    return out;
  }

 private:
  std::FILE* file_ = std::tmpfile();
};

// Counts how often it is described, to prove when formatting happens.
struct Counted {
  mutable std::atomic<int> calls{0};
  std::string description() const { return ++calls, "counted"; }
};

class LogTest : public ::testing::Test {
 protected:
  void SetUp() override { reset(); }
  void TearDown() override {
    internal::Output::shared().setDescriptorForTesting(STDERR_FILENO);
    reset();
  }
  static void reset() {
    for (const char* name : {"QV_LOG", "QV_LOG_PRIVATE", "JOURNAL_STREAM"}) unsetenv(name);
    LoggerRegistry::shared().reloadEnvironmentForTesting();
  }
  static const Logger& logger(std::string_view subsystem, std::string_view category) {
    return *LoggerRegistry::shared().logger(subsystem, category).value();
  }
};

}  // namespace platform::log::testing
