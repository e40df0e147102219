// Small measuring tools for the registry benchmark: wall time of one call,
// medians, resident memory, and the table the results are printed as.
//
// Thread safety: plain functions and values; the table is for one thread.
#pragma once

#include <malloc.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string>
#include <vector>

namespace bench::registry {

// Seconds that `work` took.
template <typename Work>
double secondsOf(Work&& work) {
  const auto start = std::chrono::steady_clock::now();
  work();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

inline double median(std::vector<double> samples) {
  if (samples.empty()) return 0;
  const auto middle = samples.begin() + static_cast<std::ptrdiff_t>(samples.size() / 2);
  std::nth_element(samples.begin(), middle, samples.end());
  return *middle;
}

// Resident bytes of this process, after handing the allocator's free pages
// back to the system, so that memory freed by earlier work is not counted.
inline long residentBytes() {
  ::malloc_trim(0);
  long size = 0;
  long resident = -1;
  if (std::FILE* statm = std::fopen("/proc/self/statm", "r")) {
    if (std::fscanf(statm, "%ld %ld", &size, &resident) != 2) resident = -1;
    std::fclose(statm);
  }
  return resident < 0 ? -1 : resident * ::sysconf(_SC_PAGESIZE);
}

inline std::string format(const char* pattern, double value) {
  char text[64];
  std::snprintf(text, sizeof text, pattern, value);
  return text;
}
// 10000 as "10,000".
inline std::string grouped(std::size_t n) {
  std::string digits = std::to_string(n);
  for (std::size_t at = digits.size(); at > 3; at -= 3) digits.insert(at - 3, ",");
  return digits;
}
inline std::string millis(double seconds) {
  return format("%.3f ms", seconds * 1e3);
}
inline std::string micros(double seconds) {
  return format("%.2f us", seconds * 1e6);
}
inline std::string times(double ratio) {
  return format("%.2fx", ratio);
}

// Lines of "figure  value  note", printed when the run is over so that the
// figures stay together below whatever the run logged.
class Table {
 public:
  void section(std::string title) { rows_.push_back({std::move(title), "", "", true}); }
  void add(std::string figure, std::string value, std::string note = {}) {
    rows_.push_back({std::move(figure), std::move(value), std::move(note), false});
  }
  void print() const {
    for (const Row& row : rows_) {
      if (row.heading) {
        std::printf("\n%s\n", row.figure.c_str());
      } else {
        std::printf("  %-52s %14s  %s\n", row.figure.c_str(), row.value.c_str(), row.note.c_str());
      }
    }
    std::fflush(stdout);
  }

 private:
  struct Row {
    std::string figure, value, note;
    bool heading;
  };
  std::vector<Row> rows_;
};

}  // namespace bench::registry
