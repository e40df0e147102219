// Feeds arbitrary format strings and argument lists to the formatter. The
// input's first bytes choose up to eight arguments of every kind; the rest is
// the format. The formatter must never crash, read out of bounds or exceed
// its size limit, and line escaping must leave one line.
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log/Format.h"
#include "platform/log/internal/Argument.h"
#include "platform/log/internal/LineFormat.h"
#include "platform/values/Value.h"

namespace {

using platform::log::internal::Argument;
using platform::log::internal::capture;

struct Pool {
  std::array<std::uint8_t, 16> uuid{};
  std::string text;
  platform::Value value;
  std::shared_ptr<const std::string> nullShared;
  std::int64_t integer = 0;
};

Argument choose(std::uint8_t selector, std::uint64_t number, const Pool& pool) {
  switch (selector % 12) {
    case 0:
      return capture(static_cast<int>(number));
    case 1:
      return capture(static_cast<std::int64_t>(number));
    case 2:
      return capture(number);
    case 3:
      return capture(static_cast<double>(static_cast<std::int64_t>(number)) / 7.0);
    case 4: {
      double d;
      std::memcpy(&d, &number, sizeof d);  // NaN, infinities, denormals
      return capture(d);
    }
    case 5:
      return capture(pool.text);
    case 6:
      return capture(static_cast<const char*>(nullptr));
    case 7:
      return capture(pool.uuid);
    case 8:
      return capture(pool.uuid.data());
    case 9:
      return capture(pool.value);
    case 10:
      return capture(pool.nullShared);
    default:
      return capture(static_cast<char>(number));
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 1) return 0;
  std::size_t count = data[0] % 9;
  std::size_t header = 1 + count * 9;
  if (size < header) return 0;
  std::string_view rest(reinterpret_cast<const char*>(data + header), size - header);

  Pool pool;
  std::memcpy(pool.uuid.data(), data, size < 16 ? size : 16);
  pool.text = std::string(rest.substr(0, 64));
  pool.value = platform::Value(pool.text);
  std::vector<Argument> arguments;
  for (std::size_t i = 0; i < count; ++i) {
    const std::uint8_t* a = data + 1 + i * 9;
    std::uint64_t number;
    std::memcpy(&number, a + 1, sizeof number);
    arguments.push_back(choose(a[0], number, pool));
  }

  for (auto redaction : {platform::log::Redaction::On, platform::log::Redaction::Off}) {
    std::string message = platform::log::formatArguments(redaction, rest, arguments);
    if (message.size() > platform::log::kMaxMessageBytes + platform::log::kTruncatedMarker.size()) {
      std::abort();
    }
    std::string line;
    platform::log::internal::appendEscaped(line, message);
    for (char c : line) {
      if (c == '\n' || c == '\r') std::abort();
    }
  }
  return 0;
}
