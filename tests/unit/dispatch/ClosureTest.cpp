#include "platform/dispatch/internal/Closure.h"

#include <gtest/gtest.h>

#include <array>
#include <memory>

namespace platform::dispatch {
namespace {

// Counts live copies so that leaks and double destruction both show.
struct Tracked {
  explicit Tracked(int* live) : live(live) { ++*live; }
  Tracked(Tracked&& other) noexcept : live(other.live) { ++*live; }
  Tracked(const Tracked&) = delete;
  ~Tracked() { --*live; }
  int* live;
};

TEST(DispatchClosure, InlineAndHeapCallablesRunAndDieExactlyOnce) {
  int live = 0;
  int calls = 0;
  {
    Closure inlineClosure([t = Tracked(&live), &calls] { ++calls; });
    std::array<char, 200> padding{};
    Closure heapClosure([t = Tracked(&live), padding, &calls] { calls += 1 + padding[0]; });
    EXPECT_EQ(live, 2);

    Closure moved = std::move(inlineClosure);
    Closure movedHeap;
    movedHeap = std::move(heapClosure);
    EXPECT_FALSE(inlineClosure);  // NOLINT(bugprone-use-after-move): moved-from is empty
    EXPECT_FALSE(heapClosure);    // NOLINT(bugprone-use-after-move)
    EXPECT_EQ(live, 2);
    moved();
    moved();
    movedHeap();
    EXPECT_EQ(calls, 3);

    moved = Closure([] {});  // assigning over a full closure destroys the old callable
    EXPECT_EQ(live, 1);
  }
  EXPECT_EQ(live, 0);
}

TEST(DispatchClosure, AcceptsMoveOnlyCapturesResultsAndFunctionPointers) {
  auto owned = std::make_unique<int>(41);
  int seen = 0;
  Closure c([p = std::move(owned), &seen] {
    seen = ++*p;
    return seen;  // a result is discarded
  });
  c();
  EXPECT_EQ(seen, 42);

  static int hits;
  hits = 0;
  void (*fn)() = [] { ++hits; };
  Closure viaPointer(fn);
  viaPointer();
  EXPECT_EQ(hits, 1);

  void (*none)() = nullptr;
  EXPECT_FALSE(Closure(none));
  EXPECT_FALSE(Closure(nullptr));
}

}  // namespace
}  // namespace platform::dispatch
