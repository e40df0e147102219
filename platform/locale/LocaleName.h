// Locale names as configuration gives them ("de_DE.UTF-8", "C", "sr@latin")
// turned into the names bundles file their strings under ("de_DE").
//
// Thread safety: pure functions.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform::locale {

inline constexpr std::string_view kFallbackLocale = "en";

// "de_DE.UTF-8" -> "de_DE", "fr@euro" -> "fr"; "C", "POSIX" and anything
// that is not letters, digits, '_' or '-' (at most 64 bytes) -> none.
std::optional<std::string> normalizeLocaleName(std::string_view name);

// The value of the LANG line of a locale.conf text (quotes removed), or
// none. Later lines win; comments and other variables are ignored.
std::optional<std::string> langFromLocaleConf(std::string_view text);

// Where to look for a string, most specific first, without repeats:
// "de_CH" -> {"de_CH", "de", "en"}.
std::vector<std::string> lookupOrder(const std::string& locale);

}  // namespace platform::locale
