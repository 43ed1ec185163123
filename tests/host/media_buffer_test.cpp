#include <atomic>
#include <cstring>
#include <memory>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "host/memory_pools.h"
#include "platform/mra_pool.h"

namespace {

const MmfMemoryPoolOps& PoolOps() { return *host::MemoryPool::Ops(); }

class MediaBufferTest : public testing::Test {
 protected:
  void SetUp() override {
    mras_ = host::MakeMraPool(2, 4);
    ASSERT_NE(mras_, nullptr);
    ASSERT_EQ(MmfAcquireMra(mras_, &mra_, kMmfAcquireNoWait), 0);
  }
  void TearDown() override {
    if (mra_) MmfReleaseMra(mra_);
    MmfFreeMraPool(mras_);
  }
  MmfMraPool* mras_ = nullptr;
  MmfMra* mra_ = nullptr;
  host::MemoryPool bytes_{256, 2};
};

TEST_F(MediaBufferTest, AcquiredBufferIsEmptyWithThePoolCapacity) {
  EXPECT_EQ(mra_->Capacity, 4u);
  EXPECT_EQ(mra_->ElementCount, 0u);
  uint32_t kind = 0;
  EXPECT_NE(MmfGetMraElementType(mra_, 0, &kind), 0);
}

TEST_F(MediaBufferTest, PropertyValuesKeep48Bits) {
  const struct {
    uint32_t type, low;
    uint16_t high;
  } cases[] = {{kMmfPropFileOffset, 0xFFFFFFFF, 0xFFFF}, {kMmfPropVideoTime, 40000, 0}, {kMmfPropTimeMarker, 0, 1}};
  uint32_t index = 0;
  for (const auto& c : cases) {
    ASSERT_EQ(MmfSetMraPropertyElement(mra_, index, c.type, c.low, c.high), 0);
    ++index;
  }
  index = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(index);
    uint32_t kind = 0, type = 0, low = 0;
    uint16_t high = 0;
    ASSERT_EQ(MmfGetMraElementType(mra_, index, &kind), 0);
    EXPECT_EQ(kind, uint32_t{kMmfElementProperty});
    ASSERT_EQ(MmfGetMraPropertyElement(mra_, index, &type, &low, &high), 0);
    EXPECT_EQ(type, c.type);
    EXPECT_EQ(MmfPropertyValue(low, high), (uint64_t{c.high} << 32) | c.low);
    ++index;
  }
  EXPECT_EQ(MmfPropertyValue(0xFFFFFFFF, 0xFFFF), 0xFFFFFFFFFFFFull);
}

TEST_F(MediaBufferTest, IndexesBeyondTheNextOrTheCapacityAreRefused) {
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 1, kMmfPropSkipMark, 0, 0), 28);  // a gap
  for (uint32_t i = 0; i < 4; ++i) ASSERT_EQ(MmfSetMraPropertyElement(mra_, i, kMmfPropSkipMark, i, 0), 0);
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 4, kMmfPropSkipMark, 0, 0), 28);
  EXPECT_EQ(mra_->ElementCount, 4u);
  // Replacing an element keeps the count.
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 2, kMmfPropFrameEnd, 7, 0), 0);
  EXPECT_EQ(mra_->ElementCount, 4u);
  uint32_t type = 0, low = 0;
  uint16_t high = 0;
  ASSERT_EQ(MmfGetMraPropertyElement(mra_, 2, &type, &low, &high), 0);
  EXPECT_EQ(type, uint32_t{kMmfPropFrameEnd});
  EXPECT_EQ(low, 7u);
}

TEST_F(MediaBufferTest, ElementsAreReadOnlyAsTheirOwnKind) {
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes_.handle(), &buffer, 0), 0);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 0, kMmfPropFileOffset, 100, 0), 0);
  ASSERT_EQ(MmfSetMraBufferElement(mra_, 1, buffer, buffer->Data + 10, 20), 0);
  MmfPoolBuffer* handle = nullptr;
  uint8_t* address = nullptr;
  uint32_t size = 0, type = 0, low = 0, kind = 0;
  uint16_t high = 0;
  EXPECT_NE(MmfGetMraBufferElement(mra_, 0, &handle, &address, &size), 0);
  EXPECT_NE(MmfGetMraPropertyElement(mra_, 1, &type, &low, &high), 0);
  ASSERT_EQ(MmfGetMraElementType(mra_, 1, &kind), 0);
  EXPECT_EQ(kind, uint32_t{kMmfElementBuffer});
  ASSERT_EQ(MmfGetMraBufferElement(mra_, 1, &handle, &address, &size), 0);
  EXPECT_EQ(handle, buffer);
  EXPECT_EQ(address, buffer->Data + 10);
  EXPECT_EQ(size, 20u);
  PoolOps().ReleaseBuffer(buffer);
}

TEST_F(MediaBufferTest, BufferElementMustLieInsideItsPoolBuffer) {
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes_.handle(), &buffer, 0), 0);
  const struct {
    ptrdiff_t offset;
    uint32_t size;
    int result;
  } cases[] = {{0, 256, 0}, {255, 1, 0}, {256, 0, 0}, {200, 57, 22}, {-1, 1, 22}, {257, 0, 22}, {0, 257, 22}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.offset);
    EXPECT_EQ(MmfSetMraBufferElement(mra_, 0, buffer, buffer->Data + c.offset, c.size), c.result);
  }
  EXPECT_EQ(MmfSetMraBufferElement(mra_, 0, nullptr, buffer->Data, 1), 22);
  PoolOps().ReleaseBuffer(buffer);
}

// The zero-copy path: an output media buffer refers to an input buffer's bytes
// after the input media buffer and the producer's own reference are gone.
TEST_F(MediaBufferTest, OutputReferenceKeepsInputBytesAfterTheInputIsReleased) {
  MmfPoolBuffer* input_bytes = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes_.handle(), &input_bytes, 0), 0);
  std::memcpy(input_bytes->Data, "frame-bytes", 11);
  MmfMra* input = nullptr;
  ASSERT_EQ(MmfAcquireMra(mras_, &input, kMmfAcquireNoWait), 0);
  ASSERT_EQ(MmfSetMraPropertyElement(input, 0, kMmfPropFileOffset, 4096, 0), 0);
  ASSERT_EQ(MmfSetMraBufferElement(input, 1, input_bytes, input_bytes->Data, 256), 0);
  PoolOps().ReleaseBuffer(input_bytes);  // the producer keeps no reference of its own
  EXPECT_EQ(host::BufferReferences(input_bytes), 1u);

  MmfPoolBuffer* handle = nullptr;
  uint8_t* address = nullptr;
  uint32_t size = 0;
  ASSERT_EQ(MmfGetMraBufferElement(input, 1, &handle, &address, &size), 0);
  ASSERT_EQ(MmfSetMraBufferElement(mra_, 0, handle, address + 6, 5), 0);
  EXPECT_EQ(host::BufferReferences(input_bytes), 2u);

  ASSERT_EQ(MmfReleaseMra(input), 0);
  EXPECT_EQ(host::BufferReferences(input_bytes), 1u);
  EXPECT_EQ(bytes_.FreeCount(), 1u);  // still held by the output
  EXPECT_EQ(std::memcmp(address + 6, "bytes", 5), 0);

  ASSERT_EQ(MmfReleaseMra(mra_), 0);
  mra_ = nullptr;
  EXPECT_EQ(host::BufferReferences(input_bytes), 0u);
  EXPECT_EQ(bytes_.FreeCount(), 2u);
}

TEST_F(MediaBufferTest, ReplacingABufferElementDropsItsReference) {
  MmfPoolBuffer* first = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes_.handle(), &first, 0), 0);
  ASSERT_EQ(MmfSetMraBufferElement(mra_, 0, first, first->Data, 1), 0);
  PoolOps().ReleaseBuffer(first);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 0, kMmfPropSkipMark, 0, 0), 0);
  EXPECT_EQ(bytes_.FreeCount(), 2u);
}

TEST(MraPoolTest, PoolForAChannelHasItsFormatBufferCount) {
  MmfChannel channel{};
  channel.Format.buffer_count = 3;
  MmfMraPool* pool = nullptr;
  ASSERT_EQ(MmfAllocateMraPool(&pool, &channel, 600), 0);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 3u);
  MmfMra* mra = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &mra, 0), 0);
  EXPECT_EQ(mra->Capacity, 600u);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 2u);
  MmfReleaseMra(mra);
  EXPECT_EQ(MmfFreeMraPool(pool), 0);

  channel.Format.buffer_count = 0;
  ASSERT_EQ(MmfAllocateMraPool(&pool, &channel, 8), 0);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 1u);
  MmfFreeMraPool(pool);

  EXPECT_EQ(MmfAllocateMraPool(nullptr, &channel, 8), 22);
  EXPECT_EQ(MmfAllocateMraPool(&pool, nullptr, 8), 22);
  EXPECT_EQ(MmfAllocateMraPool(&pool, &channel, 0), 22);
}

TEST(MraPoolTest, ExhaustedPoolAnswers11WithoutWaiting) {
  MmfMraPool* pool = host::MakeMraPool(1, 2);
  MmfMra* first = nullptr;
  MmfMra* second = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &first, kMmfAcquireNoWait), 0);
  EXPECT_EQ(MmfAcquireMra(pool, &second, kMmfAcquireNoWait), 11);
  EXPECT_EQ(second, nullptr);
  MmfReleaseMra(first);
  EXPECT_EQ(MmfReleaseMra(first), 22);  // released twice
  MmfFreeMraPool(pool);
}

TEST(MraPoolTest, MediaBufferOutlivesItsFreedPool) {
  host::MemoryPool bytes(16, 1);
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes.handle(), &buffer, 0), 0);
  MmfMraPool* pool = host::MakeMraPool(1, 2);
  MmfMra* mra = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &mra, 0), 0);
  ASSERT_EQ(MmfSetMraBufferElement(mra, 0, buffer, buffer->Data, 16), 0);
  PoolOps().ReleaseBuffer(buffer);
  EXPECT_EQ(MmfFreeMraPool(pool), 0);
  EXPECT_EQ(mra->ElementCount, 1u);
  EXPECT_EQ(MmfReleaseMra(mra), 0);
  EXPECT_EQ(bytes.FreeCount(), 1u);
}

TEST(MraPoolTest, WaitingAcquireWakesWhenAnotherThreadReleases) {
  MmfMraPool* pool = host::MakeMraPool(1, 1);
  MmfMra* held = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &held, 0), 0);
  std::thread releaser([held] {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    MmfReleaseMra(held);
  });
  MmfMra* again = nullptr;
  EXPECT_EQ(MmfAcquireMra(pool, &again, 0), 0);
  releaser.join();
  EXPECT_EQ(again, held);
  MmfReleaseMra(again);
  MmfFreeMraPool(pool);
}

TEST(MraPoolTest, ThreadsSharingInputBytesLeaveEveryBufferFree) {
  constexpr int kThreads = 6;
  constexpr int kRounds = 1000;
  host::MemoryPool bytes(64, 2);
  MmfMraPool* pool = host::MakeMraPool(4, 8);
  MmfPoolBuffer* shared = nullptr;
  ASSERT_EQ(PoolOps().AcquireBuffer(bytes.handle(), &shared, 0), 0);
  std::atomic<int> failures{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int round = 0; round < kRounds; ++round) {
        MmfMra* mra = nullptr;
        if (MmfAcquireMra(pool, &mra, 0) != 0) {
          ++failures;
          continue;
        }
        uint32_t offset = static_cast<uint32_t>((t + round) % 64);
        if (MmfSetMraBufferElement(mra, 0, shared, shared->Data + offset, 64 - offset) != 0) ++failures;
        if (MmfSetMraPropertyElement(mra, 1, kMmfPropAudioTime, static_cast<uint32_t>(round), 0) != 0) ++failures;
        if (MmfReleaseMra(mra) != 0) ++failures;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(failures.load(), 0);
  EXPECT_EQ(host::BufferReferences(shared), 1u);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 4u);
  PoolOps().ReleaseBuffer(shared);
  EXPECT_EQ(bytes.FreeCount(), 2u);
  MmfFreeMraPool(pool);
}

}  // namespace
