// The system library of the host: its heap, which keeps small blocks per
// thread apart from malloc's, and the room left on the stack.

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <thread>
#include <vector>

#include "host/heap_control.h"
#include "platform/system.h"

namespace {

struct Block {
  uint8_t* bytes;
  size_t size;
  uint8_t mark;
};

// Blocks of every size up to past the largest kept apart from malloc's, each
// filled with its own mark.
std::vector<Block> MakeBlocks(size_t largest, uint8_t first_mark) {
  std::vector<Block> blocks;
  for (size_t size = 1; size <= largest; ++size) {
    auto* bytes = static_cast<uint8_t*>(SysAlloc(size));
    EXPECT_NE(bytes, nullptr) << size << " bytes asked";
    if (!bytes) continue;
    EXPECT_EQ(reinterpret_cast<uintptr_t>(bytes) % alignof(std::max_align_t), 0u) << size << " bytes asked";
    const auto mark = static_cast<uint8_t>(first_mark + size);
    for (size_t i = 0; i < size; ++i) bytes[i] = mark;
    blocks.push_back({bytes, size, mark});
  }
  return blocks;
}

// Every block still holds its own mark in each of its bytes: no block was
// smaller than asked, and no two overlap.
void ExpectIntact(const std::vector<Block>& blocks) {
  for (const Block& block : blocks) {
    size_t changed = 0;
    for (size_t i = 0; i < block.size; ++i) changed += block.bytes[i] != block.mark;
    EXPECT_EQ(changed, 0u) << "block of " << block.size << " bytes";
  }
}

void FreeBlocks(const std::vector<Block>& blocks) {
  for (const Block& block : blocks) SysFree(block.bytes);
}

constexpr size_t kLargest = 300;  // past the small sizes, into malloc's

// Blocks given back are handed out again, on the thread that freed them or
// on another once it has ended: each must hold what was asked, apart from
// every other, and be counted.
TEST(HostHeapTest, BlocksGivenBackServeLaterRequestsOfTheirSize) {
  const int64_t live_before = host::LiveBlockCount();
  const uint64_t count_before = host::AllocationCount();

  std::vector<Block> kept = MakeBlocks(kLargest, 0);
  for (int round = 0; round < 2; ++round) {
    std::vector<Block> blocks = MakeBlocks(kLargest, static_cast<uint8_t>(round + 1));
    EXPECT_EQ(host::LiveBlockCount(), live_before + static_cast<int64_t>(2 * kLargest));
    ExpectIntact(blocks);
    FreeBlocks(blocks);
  }

  // Made on one thread, freed on a second, which makes more and ends with
  // blocks on its lists; the blocks it left serve this thread.
  std::vector<Block> from_other;
  std::thread maker([&] { from_other = MakeBlocks(kLargest, 7); });
  maker.join();
  std::thread freer([&] {
    FreeBlocks(from_other);
    std::vector<Block> own = MakeBlocks(kLargest, 9);
    ExpectIntact(own);
    FreeBlocks(own);
    FreeBlocks(MakeBlocks(kLargest, 11));
  });
  freer.join();
  std::vector<Block> after = MakeBlocks(kLargest, 13);
  ExpectIntact(kept);
  ExpectIntact(after);
  FreeBlocks(after);
  FreeBlocks(kept);

  EXPECT_EQ(host::LiveBlockCount(), live_before);
  EXPECT_EQ(host::AllocationCount(), count_before + 7 * kLargest);
}

[[gnu::noinline]] size_t AvailableBelowABigFrame() {
  volatile char big[8192];
  big[0] = 1;
  size_t available = SysStackAvail();
  return available + big[0] - 1;
}

// The stream refuses to recurse on what this reports.
TEST(HostStackTest, ReportsRoomBelowTheCaller) {
  size_t here = SysStackAvail();
  EXPECT_GT(here, 4224u);
  EXPECT_LE(AvailableBelowABigFrame() + 8192, here);
}

}  // namespace
