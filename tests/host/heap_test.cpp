#include <gtest/gtest.h>
#include <malloc.h>

#include <cstring>
#include <vector>

#include "host/heap_control.h"
#include "platform/system.h"

namespace {

// Blocks given back are handed out again for other sizes: each must still
// hold what was asked, whatever sizes the underlying allocator rounds to
// (under ThreadSanitizer it rounds to none), and be counted.
TEST(HostHeapTest, ReusedBlocksHoldTheSizeAsked) {
  const int64_t live_before = host::LiveBlockCount();
  const uint64_t count_before = host::AllocationCount();
  constexpr size_t kLargest = 160;
  for (size_t round = 0; round < 2; ++round) {
    std::vector<void*> blocks;
    for (size_t size = 1; size <= kLargest; ++size) {
      // Freed in the order they were made, the blocks come back last first:
      // the second round's sizes each get a block freed for another size.
      const size_t asked = size;
      void* block = SysAlloc(asked);
      ASSERT_NE(block, nullptr);
      EXPECT_GE(malloc_usable_size(block), asked) << asked << " bytes asked";
      std::memset(block, 0xA5, asked);
      blocks.push_back(block);
    }
    EXPECT_EQ(host::LiveBlockCount(), live_before + static_cast<int64_t>(kLargest));
    for (void* block : blocks) SysFree(block);
  }
  EXPECT_EQ(host::LiveBlockCount(), live_before);
  EXPECT_EQ(host::AllocationCount(), count_before + 2 * kLargest);
}

}  // namespace
