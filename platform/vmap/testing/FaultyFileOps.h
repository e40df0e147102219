// A FileOps that passes calls on to another (the real one by default) but
// fails a chosen call of a chosen step with a chosen errno, and logs every
// step, for fault-injection tests of code that replaces files.
//
// Thread safety: not thread-safe; use one per test.
#pragma once

#include <vector>

#include "platform/vmap/FileOps.h"

namespace platform::vmap {

// Whether a failing write first writes part of its bytes, as a disk that
// fills up mid-write does.
enum class PartialWrite { No, Yes };

class FaultyFileOps final : public FileOps {
 public:
  // `inner` is borrowed and must outlive this object.
  explicit FaultyFileOps(FileOps& inner = FileOps::real()) : inner_(inner) {}
  // Deleted so that wrapping one fake in another cannot silently copy it
  // instead (pass it as a FileOps&).
  FaultyFileOps(const FaultyFileOps&) = delete;
  FaultyFileOps& operator=(const FaultyFileOps&) = delete;

  // The `occurrence`-th call (1-based) of `step` fails with `err`. A failing
  // Close still closes the descriptor (as close(2) does); any other failing
  // step does nothing but fail. One fault at a time: a new call replaces it.
  void failAt(FileStep step, int err, int occurrence = 1,
              PartialWrite partial = PartialWrite::No);

  // Every step attempted so far, failed ones included, in order.
  const std::vector<FileStep>& steps() const { return steps_; }
  // Whether the fault was injected.
  bool fired() const { return fired_; }

  Result<int> openFile(const std::string& path, mode_t mode, Exclusive exclusive) override;
  Status write(int fd, std::span<const std::uint8_t> bytes) override;
  Status fsync(int fd) override;
  Status fsyncDirectory(int fd) override;
  Status close(int fd) override;
  Status rename(const std::string& from, const std::string& to) override;
  Status unlink(const std::string& path) override;
  Result<int> openDirectory(const std::string& path) override;

 private:
  // Logs the step; returns the injected error's errno when this call fails.
  int enter(FileStep step);

  FileOps& inner_;
  std::vector<FileStep> steps_;
  FileStep step_ = FileStep::OpenFile;
  int errno_ = 0;  // 0: no fault armed
  int occurrence_ = 0;
  PartialWrite partial_ = PartialWrite::No;
  bool fired_ = false;
};

}  // namespace platform::vmap
