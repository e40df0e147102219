// A bundle's localized strings: <bundle>/locale/<lang>/<Table>.vmap, each a
// dictionary from key to text, looked up for the full locale ("de_CH"),
// then its language ("de"), then "en". Tables are read afresh; the daemon
// caches what it derives from them.
//
// Thread safety: pure functions of the file system; safe from any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"

namespace platform::locale {

// The first of the locale's tables named `table` that exists, or none when
// none does. An error when a table exists but cannot be read or is not a
// dictionary (the next one is not tried: a broken translation is a fault to
// report, not to hide). `table` is one path component ("Localizable").
Result<std::optional<Dictionary>> localizedTable(std::string_view bundlePath,
                                                 std::string_view table,
                                                 const std::string& locale);

// The text of `key` in the most specific table that has it as text; none
// when no table does. Unreadable tables count as not having it.
std::optional<std::string> localizedString(std::string_view bundlePath, std::string_view table,
                                           std::string_view key, const std::string& locale);

}  // namespace platform::locale
