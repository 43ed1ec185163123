#include <gtest/gtest.h>

#include "host/heap_control.h"
#include "platform/system.h"

namespace {

TEST(HostHeapTest, FailsExactlyTheNthAllocationFromNow) {
  for (uint64_t n : {1, 2, 5}) {
    host::FailNthAllocation(n);
    void* blocks[6];
    for (uint64_t i = 1; i <= 6; ++i) {
      blocks[i - 1] = SysAlloc(8);
      EXPECT_EQ(blocks[i - 1] == nullptr, i == n) << "allocation " << i << " with n " << n;
    }
    for (void* block : blocks) SysFree(block);
  }
  host::FailNthAllocation(0);
}

TEST(HostHeapTest, CountsLiveBlocks) {
  int64_t before = host::LiveBlockCount();
  void* a = SysAlloc(1);
  void* b = SysAlloc(0);
  EXPECT_EQ(host::LiveBlockCount(), before + 2);
  SysFree(a);
  SysFree(b);
  SysFree(nullptr);
  EXPECT_EQ(host::LiveBlockCount(), before);
}

[[gnu::noinline]] size_t AvailableBelowABigFrame() {
  volatile char big[8192];
  big[0] = 1;
  size_t available = SysStackAvail();
  return available + big[0] - 1;
}

TEST(HostStackTest, ReportsRoomBelowTheCaller) {
  size_t here = SysStackAvail();
  EXPECT_GT(here, 4224u);
  EXPECT_LE(AvailableBelowABigFrame() + 8192, here);
}

}  // namespace
