// A string builder with a hard size limit: what does not fit is dropped, and
// the result then ends with a truncation marker.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform::log::internal {

// Thread safety: not thread-safe; one builder per message, on one thread.
class BoundedText {
 public:
  explicit BoundedText(std::size_t limit) : limit_(limit) {}

  bool full() const { return truncated_; }
  std::size_t size() const { return text_.size(); }

  void append(std::string_view text) {
    if (truncated_) return;
    std::size_t room = limit_ - text_.size();
    if (text.size() <= room) {
      text_.append(text);
      return;
    }
    // Cut before a UTF-8 continuation byte, so the cut leaves whole characters.
    std::size_t cut = room;
    for (int back = 0; back < 3 && cut > 0 && cut < text.size() &&
                       (static_cast<unsigned char>(text[cut]) & 0xC0) == 0x80;
         ++back) {
      --cut;
    }
    text_.append(text.substr(0, cut));
    truncated_ = true;
  }

  void append(std::size_t count, char c) {
    if (truncated_) return;
    std::size_t room = limit_ - text_.size();
    if (count <= room) {
      text_.append(count, c);
      return;
    }
    text_.append(room, c);
    truncated_ = true;
  }

  // The text, with `marker` appended when something was dropped.
  std::string finish(std::string_view marker) && {
    if (truncated_) text_.append(marker);
    return std::move(text_);
  }

 private:
  const std::size_t limit_;
  std::string text_;
  bool truncated_ = false;
};

}  // namespace platform::log::internal
