#pragma once
// Every allocation of an operation failing in turn: the operation is run again
// and again, its nth allocation failing on run n, until a run makes fewer than
// n allocations; no run may leave a block behind.

#include <gtest/gtest.h>

#include <cstdint>

#include "host/heap_control.h"

namespace testing_support {

// Arms the failure: the nth allocation from here fails. Reached() disarms and
// tells whether that allocation was asked for.
class FailingAllocation {
 public:
  explicit FailingAllocation(uint64_t n) : n_(n), before_(host::AllocationCount()) { host::FailNthAllocation(n); }
  ~FailingAllocation() { host::FailNthAllocation(0); }
  FailingAllocation(const FailingAllocation&) = delete;
  FailingAllocation& operator=(const FailingAllocation&) = delete;
  bool Reached() {
    host::FailNthAllocation(0);
    return host::AllocationCount() - before_ >= n_;
  }

 private:
  uint64_t n_, before_;
};

// Calls run(n) for n = 1, 2, ...; run sets up what must not fail, arms a
// FailingAllocation(n) for the operation, checks its answer and returns
// Reached(). Returns how many runs had an allocation fail.
template <typename Run>
uint64_t EachAllocationFailing(Run run, uint64_t limit = 20000) {
  for (uint64_t n = 1; n < limit; ++n) {
    const int64_t live = host::LiveBlockCount();
    const bool reached = run(n);
    EXPECT_EQ(host::LiveBlockCount(), live) << "allocation " << n << " failing";
    if (!reached || testing::Test::HasFatalFailure()) return n - 1;
  }
  ADD_FAILURE() << "still failing after " << limit << " allocations";
  return limit;
}

}  // namespace testing_support
