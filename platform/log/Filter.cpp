#include "platform/log/Filter.h"

#include <optional>

#include "platform/log/internal/NameRules.h"

namespace platform::log {
namespace {

constexpr std::size_t kMaxQuotedBytes = 64;

bool isSpace(char c) {
  return c == ' ' || (c >= '\t' && c <= '\r');
}

std::string_view trim(std::string_view s) {
  while (!s.empty() && isSpace(s.front())) s.remove_prefix(1);
  while (!s.empty() && isSpace(s.back())) s.remove_suffix(1);
  return s;
}

std::string problem(std::string_view entry, std::string_view reason) {
  std::string out = "ignoring malformed entry \"";
  if (entry.size() > kMaxQuotedBytes) {
    out.append(entry.substr(0, kMaxQuotedBytes));
    out.append("...");
  } else {
    out.append(entry);
  }
  out.append("\": ");
  out.append(reason);
  return out;
}

}  // namespace

Filter::Parsed Filter::parse(std::string_view text) {
  Parsed parsed;
  if (text.size() > kMaxTextBytes) {
    // Keep only the entries that end within the limit.
    std::string_view kept = text.substr(0, kMaxTextBytes + 1);
    std::size_t lastComma = kept.rfind(',');
    text = lastComma == std::string_view::npos ? std::string_view() : text.substr(0, lastComma);
    parsed.problems.push_back("longer than " + std::to_string(kMaxTextBytes) +
                              " bytes; the rest is ignored");
  }
  std::size_t entries = 0;
  bool reportedTooMany = false;
  while (!text.empty()) {
    std::size_t comma = text.find(',');
    std::string_view entry = trim(text.substr(0, comma));
    text = comma == std::string_view::npos ? std::string_view() : text.substr(comma + 1);
    if (entry.empty()) continue;
    if (++entries > kMaxEntries) {
      if (!reportedTooMany) {
        parsed.problems.push_back("more than " + std::to_string(kMaxEntries) +
                                  " entries; the rest are ignored");
        reportedTooMany = true;
      }
      break;
    }

    std::size_t equals = entry.find('=');
    std::optional<Threshold> threshold =
        parseThreshold(equals == std::string_view::npos ? entry : trim(entry.substr(equals + 1)));
    if (!threshold) {
      parsed.problems.push_back(problem(entry, "unknown level"));
      continue;
    }
    if (equals == std::string_view::npos) {
      parsed.filter.global_ = *threshold;
      continue;
    }
    std::string_view scope = trim(entry.substr(0, equals));
    std::string_view subsystem;
    std::string_view category = scope;
    if (std::size_t colon = scope.find(':'); colon != std::string_view::npos) {
      subsystem = scope.substr(0, colon);
      category = scope.substr(colon + 1);
      if (std::optional<LoggerError> bad = internal::checkName(subsystem)) {
        parsed.problems.push_back(problem(entry, loggerErrorName(*bad)));
        continue;
      }
    }
    if (std::optional<LoggerError> bad = internal::checkName(category)) {
      parsed.problems.push_back(problem(entry, loggerErrorName(*bad)));
      continue;
    }
    parsed.filter.rules_.push_back(Rule{std::string(subsystem), std::string(category), *threshold});
  }
  return parsed;
}

Threshold Filter::thresholdFor(std::string_view subsystem, std::string_view category) const {
  if (subsystem.empty() && category.empty()) return global_;
  std::optional<Threshold> exact;
  std::optional<Threshold> byCategory;
  for (const Rule& rule : rules_) {
    if (rule.category != category) continue;
    if (rule.subsystem.empty()) {
      byCategory = rule.threshold;
    } else if (rule.subsystem == subsystem) {
      exact = rule.threshold;
    }
  }
  if (exact) return *exact;
  if (byCategory) return *byCategory;
  return global_;
}

}  // namespace platform::log
