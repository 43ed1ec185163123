#include <atomic>
#include <chrono>
#include <cstring>
#include <memory>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "host/memory_pools.h"

namespace {

using namespace std::chrono_literals;

const MmfMemoryPoolOps& Ops() { return *host::MemoryPool::Ops(); }

TEST(MemoryPoolTest, DescribesItsBuffers) {
  host::MemoryPool pool(4096, 3);
  EXPECT_EQ(Ops().BufferSize(pool.handle()), 4096u);
  EXPECT_EQ(Ops().BufferCount(pool.handle()), 3u);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 3u);
}

TEST(MemoryPoolTest, AcquireHandsOutDistinctBuffersUntilNoneIsFree) {
  host::MemoryPool pool(64, 2);
  MmfPoolBuffer* a = nullptr;
  MmfPoolBuffer* b = nullptr;
  MmfPoolBuffer* c = nullptr;
  ASSERT_EQ(Ops().AcquireBuffer(pool.handle(), &a, 0), 0);
  ASSERT_EQ(Ops().AcquireBuffer(pool.handle(), &b, 0), 0);
  EXPECT_NE(a, b);
  EXPECT_NE(a->Data, b->Data);
  EXPECT_EQ(a->Size, 64u);
  EXPECT_EQ(a->Pool, pool.handle());
  EXPECT_EQ(host::BufferReferences(a), 1u);
  EXPECT_EQ(Ops().AcquireBuffer(pool.handle(), &c, 0), 11);
  EXPECT_EQ(c, nullptr);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 0u);
  EXPECT_EQ(Ops().ReleaseBuffer(a), 0);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 1u);
  EXPECT_EQ(host::BufferReferences(a), 0u);
  EXPECT_EQ(Ops().AcquireBuffer(pool.handle(), &c, 0), 0);
  EXPECT_EQ(c, a);
  Ops().ReleaseBuffer(b);
  Ops().ReleaseBuffer(c);
}

TEST(MemoryPoolTest, MappedBufferGoesBackThroughTheSixthEntry) {
  host::MemoryPool pool(16, 1);
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(Ops().AcquireBuffer(pool.handle(), &buffer, 0), 0);
  EXPECT_EQ(Ops().MapBuffer(buffer), 0);
  std::memset(buffer->Data, 0xAB, buffer->Size);
  EXPECT_EQ(Ops().ReleaseMappedBuffer(buffer), 0);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 1u);
}

TEST(MemoryPoolTest, BufferReturnsOnlyWithItsLastReference) {
  host::MemoryPool pool(16, 1);
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(Ops().AcquireBuffer(pool.handle(), &buffer, 0), 0);
  host::ReferenceBuffer(buffer);
  host::ReferenceBuffer(buffer);
  EXPECT_EQ(host::BufferReferences(buffer), 3u);
  Ops().ReleaseBuffer(buffer);
  host::DropBufferReference(buffer);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 0u);
  host::DropBufferReference(buffer);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 1u);
  // A further drop of a buffer already back changes nothing.
  host::DropBufferReference(buffer);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), 1u);
}

TEST(MemoryPoolTest, ReferencedBuffersOutliveThePoolObject) {
  auto pool = std::make_unique<host::MemoryPool>(32, 2);
  MmfPoolBuffer* buffer = nullptr;
  ASSERT_EQ(Ops().AcquireBuffer(pool->handle(), &buffer, 0), 0);
  std::memset(buffer->Data, 0x5A, buffer->Size);
  pool.reset();
  // Still readable and writable (the sanitizers would catch a freed block).
  EXPECT_EQ(buffer->Data[31], 0x5A);
  buffer->Data[0] = 1;
  Ops().ReleaseBuffer(buffer);
}

TEST(MemoryPoolTest, AcquireWaitingGetsABufferReleasedMeanwhile) {
  host::MemoryPool pool(8, 1);
  MmfPoolBuffer* held = pool.AcquireWaiting(0ms);
  ASSERT_NE(held, nullptr);
  EXPECT_EQ(pool.AcquireWaiting(1ms), nullptr);
  std::thread releaser([held] {
    std::this_thread::sleep_for(20ms);
    Ops().ReleaseBuffer(held);
  });
  MmfPoolBuffer* again = pool.AcquireWaiting(5s);
  releaser.join();
  ASSERT_EQ(again, held);
  Ops().ReleaseBuffer(again);
}

TEST(MemoryPoolTest, ThreadsAcquiringAndReleasingNeverShareABuffer) {
  constexpr uint32_t kBuffers = 4;
  constexpr int kThreads = 8;
  constexpr int kRounds = 2000;
  host::MemoryPool pool(sizeof(int), kBuffers);
  std::atomic<int> collisions{0};
  std::atomic<int> acquired{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int round = 0; round < kRounds; ++round) {
        MmfPoolBuffer* buffer = nullptr;
        if (Ops().AcquireBuffer(pool.handle(), &buffer, 0) != 0) continue;
        ++acquired;
        int mark = t * kRounds + round;
        std::memcpy(buffer->Data, &mark, sizeof mark);
        host::ReferenceBuffer(buffer);
        Ops().ReleaseBuffer(buffer);
        int seen;
        std::memcpy(&seen, buffer->Data, sizeof seen);
        if (seen != mark) ++collisions;
        host::DropBufferReference(buffer);
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(collisions.load(), 0);
  EXPECT_GT(acquired.load(), 0);
  EXPECT_EQ(Ops().FreeCount(pool.handle()), kBuffers);
}

TEST(MemoryPoolTest, NullArgumentsAreRefused) {
  host::MemoryPool pool(8, 1);
  MmfPoolBuffer* buffer = nullptr;
  EXPECT_EQ(Ops().AcquireBuffer(nullptr, &buffer, 0), 22);
  EXPECT_EQ(Ops().AcquireBuffer(pool.handle(), nullptr, 0), 22);
  EXPECT_EQ(Ops().MapBuffer(nullptr), 22);
  EXPECT_EQ(Ops().ReleaseMappedBuffer(nullptr), 22);
  EXPECT_EQ(Ops().ReleaseBuffer(nullptr), 22);
  EXPECT_EQ(Ops().FreeCount(nullptr), 0u);
}

}  // namespace
