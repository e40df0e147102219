#include "Quorvex/QVVersionComparison.h"

namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// Compares the digit runs that start at a[i] and b[j] by value, without
// converting them, so that arbitrarily long runs cannot overflow. Advances
// both indices past their runs.
int compareDigitRuns(std::string_view a, std::size_t& i, std::string_view b, std::size_t& j) {
  while (i < a.size() && a[i] == '0' && i + 1 < a.size() && isDigit(a[i + 1])) ++i;
  while (j < b.size() && b[j] == '0' && j + 1 < b.size() && isDigit(b[j + 1])) ++j;
  std::size_t startA = i, startB = j;
  while (i < a.size() && isDigit(a[i])) ++i;
  while (j < b.size() && isDigit(b[j])) ++j;
  std::size_t lenA = i - startA, lenB = j - startB;
  if (lenA != lenB) return lenA < lenB ? -1 : 1;
  int c = a.substr(startA, lenA).compare(b.substr(startB, lenB));
  return c < 0 ? -1 : (c > 0 ? 1 : 0);
}

}  // namespace

QVOrdering compareVersionString(std::string_view a, std::string_view b) {
  std::size_t i = 0, j = 0;
  while (i < a.size() && j < b.size()) {
    if (isDigit(a[i]) && isDigit(b[j])) {
      int c = compareDigitRuns(a, i, b, j);
      if (c != 0) return static_cast<QVOrdering>(c);
      continue;
    }
    auto ca = static_cast<unsigned char>(a[i]), cb = static_cast<unsigned char>(b[j]);
    if (ca != cb) return ca < cb ? QVOrdering::Ascending : QVOrdering::Descending;
    ++i;
    ++j;
  }
  if (i < a.size()) return QVOrdering::Descending;
  if (j < b.size()) return QVOrdering::Ascending;
  return QVOrdering::Same;
}
