// The bytes a connection still has to write: whole frames, queued in order,
// the first possibly part-written. Frames are kept as they were encoded (no
// copying into one buffer) and written with one sendmsg() per batch.
//
// Thread safety: none; the connection guards it with its mutex.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace platform::mbx::internal {

class OutputQueue {
 public:
  enum class Flush {
    Drained,     // everything was written
    WouldBlock,  // the socket is full; the rest stays queued
    Failed,      // the socket refused (errno in *error); the queue is unchanged
  };

  bool empty() const { return bytes_ == 0; }
  std::size_t bytes() const { return bytes_; }

  // Queues `frame`, of which the first `alreadyWritten` bytes went out.
  // REQUIRES: alreadyWritten < frame.size().
  void append(std::vector<std::uint8_t> frame, std::size_t alreadyWritten = 0);

  // Writes to the non-blocking socket `fd` until drained or it would block.
  Flush flushTo(int fd, int* error);

  // Drops everything and gives the memory back.
  void clear();

  // Frames handed to one sendmsg().
  static constexpr int kMaxBatch = 64;

 private:
  void dropWritten(std::size_t written);

  std::vector<std::vector<std::uint8_t>> frames_;
  std::size_t head_ = 0;        // frames_[0, head_) are written
  std::size_t headOffset_ = 0;  // bytes of frames_[head_] written
  std::size_t bytes_ = 0;       // still to write
};

}  // namespace platform::mbx::internal
