// Error objects: a domain, a signed code and optional user information whose
// localized-description entry is the human-readable message.
//
// Thread safety: immutable after construction; share freely across threads.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform {

// The user-information key under which an error carries its description.
inline constexpr std::string_view kLocalizedDescriptionKey = "LocalizedDescription";

// The domain of errors that wrap an errno value.
inline constexpr std::string_view kPosixErrorDomain = "POSIX";

class Error {
 public:
  // No description: the error has no user information at all.
  Error(std::string domain, std::int64_t code);
  Error(std::string domain, std::int64_t code, std::string description);
  Error(std::string domain, std::int64_t code, Dictionary userInfo);

  // An error of the POSIX domain for errno value `err`, described by its text
  // and, when given, what was being done ("open /x: No such file or directory").
  static Error posix(int err, std::string_view context = {});

  const std::string& domain() const { return domain_; }
  std::int64_t code() const { return code_; }
  // The localized description, or none when the error was made without one.
  const std::string* localizedDescription() const;
  // None when the error was made without a description or user information.
  const std::optional<Dictionary>& userInfo() const { return userInfo_; }

  // For "%@" in logs: the description when there is one, else a generic text
  // naming the domain and code.
  std::string description() const;

  bool is(std::string_view domain, std::int64_t code) const {
    return domain_ == domain && code_ == code;
  }

 private:
  std::string domain_;
  std::int64_t code_;
  std::optional<Dictionary> userInfo_;
};

}  // namespace platform
