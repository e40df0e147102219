// The parsers of the /proc text files read for an identity.
#include <charconv>
#include <optional>
#include <string>
#include <vector>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/ProcStat.h"
#include "platform/mbx/identity/internal/ProcStatus.h"

namespace platform::mbx::internal {
namespace {

// Digits only: no sign, no spaces, no empty text, nothing that overflows.
template <typename T>
std::optional<T> parseDecimal(std::string_view text) {
  T value{};
  if (text.empty() || text.front() < '0' || text.front() > '9') return std::nullopt;
  auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (ec != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}

Error malformed(std::string_view file, std::string_view what) {
  return identityError(IdentityErrorCode::MalformedProcFile,
                       std::string(file) + ": " + std::string(what));
}

std::string_view trimBlanks(std::string_view text) {
  while (!text.empty() && (text.front() == ' ' || text.front() == '\t')) text.remove_prefix(1);
  while (!text.empty() && (text.back() == ' ' || text.back() == '\t')) text.remove_suffix(1);
  return text;
}

}  // namespace

Result<ProcStat> parseProcStat(std::string_view text) {
  if (text.size() > kProcStatLimit) {
    return identityError(IdentityErrorCode::TooLong,
                         "stat: longer than " + std::to_string(kProcStatLimit) + " bytes");
  }
  if (!text.empty() && text.back() == '\n') text.remove_suffix(1);

  const std::size_t open = text.find(" (");
  const std::size_t close = text.rfind(')');
  if (open == std::string_view::npos || close == std::string_view::npos || close < open + 2) {
    return malformed("stat", "no command name in parentheses");
  }
  ProcStat stat;
  std::optional<pid_t> pid = parseDecimal<pid_t>(text.substr(0, open));
  if (!pid || *pid <= 0) return malformed("stat", "bad pid");
  stat.pid = *pid;
  stat.command = std::string(text.substr(open + 2, close - open - 2));

  // After the name: " S ppid pgrp ...", field 3 (state) onwards.
  std::string_view rest = text.substr(close + 1);
  if (rest.empty() || rest.front() != ' ') return malformed("stat", "no fields after the name");
  rest.remove_prefix(1);
  constexpr std::size_t kFirstField = 3;
  constexpr std::size_t kStartTimeField = 22;
  std::vector<std::string_view> fields;
  fields.reserve(kStartTimeField);
  while (fields.size() <= kStartTimeField - kFirstField) {
    const std::size_t space = rest.find(' ');
    fields.push_back(rest.substr(0, space));
    if (space == std::string_view::npos) break;
    rest.remove_prefix(space + 1);
  }
  if (fields.size() <= kStartTimeField - kFirstField) return malformed("stat", "too few fields");
  if (fields[0].size() != 1) return malformed("stat", "bad state");
  stat.state = fields[0].front();
  std::optional<std::uint64_t> start =
      parseDecimal<std::uint64_t>(fields[kStartTimeField - kFirstField]);
  if (!start) return malformed("stat", "bad start time");
  stat.startTime = *start;
  return stat;
}

Result<ProcStatusFacts> parseProcStatus(std::string_view text) {
  if (text.size() > kProcStatusLimit) {
    return identityError(IdentityErrorCode::TooLong,
                         "status: longer than " + std::to_string(kProcStatusLimit) + " bytes");
  }
  std::optional<std::string_view> seccomp;
  std::optional<std::string_view> noNewPrivs;
  while (!text.empty()) {
    const std::size_t newline = text.find('\n');
    const std::string_view line = text.substr(0, newline);
    text.remove_prefix(newline == std::string_view::npos ? text.size() : newline + 1);

    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos) continue;
    const std::string_view key = line.substr(0, colon);
    std::optional<std::string_view>* slot = key == "Seccomp"      ? &seccomp
                                            : key == "NoNewPrivs" ? &noNewPrivs
                                                                  : nullptr;
    if (slot == nullptr) continue;
    if (slot->has_value()) return malformed("status", std::string(key) + " given twice");
    *slot = trimBlanks(line.substr(colon + 1));
  }

  ProcStatusFacts facts;
  if (!noNewPrivs) return malformed("status", "no NoNewPrivs line");
  std::optional<int> nnp = parseDecimal<int>(*noNewPrivs);
  if (!nnp || *nnp > 1) return malformed("status", "bad NoNewPrivs value");
  facts.noNewPrivs = *nnp == 1;
  if (seccomp) {
    std::optional<int> mode = parseDecimal<int>(*seccomp);
    if (!mode || *mode > 2) return malformed("status", "bad Seccomp value");
    facts.seccompMode = *mode;
  }
  return facts;
}

}  // namespace platform::mbx::internal
