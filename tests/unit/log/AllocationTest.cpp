// Proves that a disabled level allocates nothing. Its own binary, because it
// replaces the global operator new to count this thread's allocations.
#include <gtest/gtest.h>

#include <cstdlib>
#include <new>
#include <string>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/values/Value.h"

namespace {
thread_local long tAllocations = 0;
}

void* operator new(std::size_t size) {
  ++tAllocations;
  if (void* p = std::malloc(size == 0 ? 1 : size)) return p;
  throw std::bad_alloc();
}
void operator delete(void* p) noexcept {
  std::free(p);
}
void operator delete(void* p, std::size_t) noexcept {
  std::free(p);
}

namespace platform::log {
namespace {

TEST(LogAllocation, DisabledLevelsAllocateNothing) {
  LoggerRegistry::shared().applyFilterForTesting("");
  const Logger& l = *LoggerRegistry::shared().logger("com.corvane.Quorvex", "ops").value();
  const std::string text(100, 't');
  const platform::Value value(text);
  ASSERT_FALSE(l.isEnabled(Level::Info));

  long before = tAllocations;
  l.debug("%s %@ %d %f %{public}@", text, value, 42, 1.5, value);
  l.info("%{uuid_t}.16P %{errno}d %s", platform::Uuid(), 2, "literal");
  EXPECT_EQ(tAllocations - before, 0);

  // The counter does see the allocations of an enabled level.
  LogCaptureForTesting capture;
  before = tAllocations;
  l.notice("%s %@ %d", text, value, 42);
  EXPECT_GT(tAllocations - before, 0);
  EXPECT_EQ(capture.size(), 1u);
}

}  // namespace
}  // namespace platform::log
