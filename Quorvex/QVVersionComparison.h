// Comparison of version strings: the rule that decides which of two plug-ins
// with the same identifier is the newer one.
//
// Thread safety: pure function.
#pragma once

#include <string_view>

enum class QVOrdering : int {
  Ascending = -1,  // the receiver is the lower version
  Same = 0,
  Descending = 1,  // the receiver is the higher version
};

// Compares `receiver` with `other` the way people read versions:
// - runs of decimal digits compare by numeric value ("1.9" < "1.10"), however
//   long they are;
// - digit runs that differ only in leading zeros are the same ("01" == "1",
//   so "1.01" == "1.1"), because the numeric value is what a version says;
// - any other characters compare one by one by byte value, case-sensitively;
// - the first difference decides; when one string runs out first with no
//   difference so far, the shorter is the lower ("1.0" < "1.0.1").
QVOrdering compareVersionString(std::string_view receiver, std::string_view other);
