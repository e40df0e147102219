#include "platform/locale/LocaleName.h"

#include <algorithm>

namespace platform::locale {

namespace {

constexpr std::size_t kMaxLocaleName = 64;

std::string_view trim(std::string_view text) {
  const auto first = text.find_first_not_of(" \t\r");
  if (first == std::string_view::npos) return {};
  const auto last = text.find_last_not_of(" \t\r");
  return text.substr(first, last - first + 1);
}

}  // namespace

std::optional<std::string> normalizeLocaleName(std::string_view name) {
  name = trim(name);
  // The encoding and the modifier do not choose a string table.
  name = name.substr(0, std::min(name.find('.'), name.find('@')));
  if (name.empty() || name.size() > kMaxLocaleName || name == "C" || name == "POSIX") {
    return std::nullopt;
  }
  const bool plain = std::all_of(name.begin(), name.end(), [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           c == '_' || c == '-';
  });
  if (!plain) return std::nullopt;
  return std::string(name);
}

std::optional<std::string> langFromLocaleConf(std::string_view text) {
  std::optional<std::string> lang;
  while (!text.empty()) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    std::string_view line = trim(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    if (line.empty() || line.front() == '#') continue;
    if (line.substr(0, 5) != "LANG=") continue;
    std::string_view value = line.substr(5);
    if (value.size() >= 2 && (value.front() == '"' || value.front() == '\'') &&
        value.back() == value.front()) {
      value = value.substr(1, value.size() - 2);
    }
    lang = std::string(value);
  }
  return lang;
}

std::vector<std::string> lookupOrder(const std::string& locale) {
  std::vector<std::string> order;
  auto add = [&](std::string name) {
    if (!name.empty() && std::find(order.begin(), order.end(), name) == order.end()) {
      order.push_back(std::move(name));
    }
  };
  add(locale);
  add(locale.substr(0, std::min(locale.find('_'), locale.find('-'))));
  add(std::string(kFallbackLocale));
  return order;
}

}  // namespace platform::locale
