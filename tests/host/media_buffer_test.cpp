// The host's memory pools and media buffers: reference-counted pool buffers,
// elements and their bounds, and the zero-copy hand-over of input bytes to an
// output buffer. Both pools under many threads are exercised by the plug-in's
// threaded playback and control stress tests.

#include <chrono>
#include <cstring>
#include <memory>
#include <thread>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/memory_pools.h"
#include "platform/mra_pool.h"

namespace {

using namespace std::chrono_literals;

const MmfMemoryPoolOps& Ops() { return *host::MemoryPool::Ops(); }

MmfPoolBuffer* Acquire(host::MemoryPool& pool) {
  MmfPoolBuffer* buffer = nullptr;
  EXPECT_EQ(Ops().AcquireBuffer(pool.handle(), &buffer, 0), 0);
  return buffer;
}

TEST(MemoryPoolTest, BufferReturnsWithItsLastReferenceAndOutlivesThePool) {
  auto pool = std::make_unique<host::MemoryPool>(64, 2);
  EXPECT_EQ(Ops().BufferSize(pool->handle()), 64u);
  EXPECT_EQ(Ops().BufferCount(pool->handle()), 2u);
  MmfPoolBuffer* a = Acquire(*pool);
  MmfPoolBuffer* b = Acquire(*pool);
  MmfPoolBuffer* c = nullptr;
  ASSERT_TRUE(a && b);
  EXPECT_NE(a->Data, b->Data);
  EXPECT_EQ(a->Pool, pool->handle());
  EXPECT_EQ(Ops().AcquireBuffer(pool->handle(), &c, 0), 11);
  EXPECT_EQ(c, nullptr);
  host::ReferenceBuffer(a);
  EXPECT_EQ(host::BufferReferences(a), 2u);
  EXPECT_EQ(Ops().ReleaseBuffer(a), 0);
  EXPECT_EQ(Ops().FreeCount(pool->handle()), 0u);
  host::DropBufferReference(a);
  EXPECT_EQ(Ops().FreeCount(pool->handle()), 1u);
  host::DropBufferReference(a);  // a further drop of a buffer already back changes nothing
  EXPECT_EQ(Ops().FreeCount(pool->handle()), 1u);
  EXPECT_EQ(Acquire(*pool), a);
  EXPECT_EQ(Ops().MapBuffer(a), 0);
  EXPECT_EQ(Ops().ReleaseMappedBuffer(a), 0);
  EXPECT_EQ(Ops().FreeCount(pool->handle()), 1u);

  std::memset(b->Data, 0x5A, 64);
  pool.reset();
  EXPECT_EQ(b->Data[63], 0x5A);  // still readable (the sanitizers would catch a freed block)
  Ops().ReleaseBuffer(b);

  EXPECT_EQ(Ops().AcquireBuffer(nullptr, &c, 0), 22);
  EXPECT_EQ(Ops().MapBuffer(nullptr), 22);
  EXPECT_EQ(Ops().ReleaseMappedBuffer(nullptr), 22);
  EXPECT_EQ(Ops().ReleaseBuffer(nullptr), 22);
  EXPECT_EQ(Ops().FreeCount(nullptr), 0u);
}

TEST(MemoryPoolTest, WaitingAcquiresGetWhatAnotherThreadReleases) {
  host::MemoryPool pool(8, 1);
  MmfPoolBuffer* held = pool.AcquireWaiting(0ms);
  ASSERT_NE(held, nullptr);
  EXPECT_EQ(pool.AcquireWaiting(1ms), nullptr);
  std::thread releaser([held] {
    std::this_thread::sleep_for(20ms);
    Ops().ReleaseBuffer(held);
  });
  EXPECT_EQ(pool.AcquireWaiting(5s), held);
  releaser.join();
  Ops().ReleaseBuffer(held);

  MmfMraPool* mras = host::MakeMraPool(1, 1);
  MmfMra* mra = nullptr;
  ASSERT_EQ(MmfAcquireMra(mras, &mra, 0), 0);
  std::thread mra_releaser([mra] {
    std::this_thread::sleep_for(20ms);
    MmfReleaseMra(mra);
  });
  MmfMra* again = nullptr;
  EXPECT_EQ(MmfAcquireMra(mras, &again, 0), 0);
  mra_releaser.join();
  EXPECT_EQ(again, mra);
  MmfReleaseMra(again);
  MmfFreeMraPool(mras);
}

class MediaBufferTest : public testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(MmfAcquireMra(mras_, &mra_, kMmfAcquireNoWait), 0); }
  void TearDown() override {
    if (mra_) MmfReleaseMra(mra_);
    MmfFreeMraPool(mras_);
  }
  MmfMraPool* mras_ = host::MakeMraPool(2, 4);
  MmfMra* mra_ = nullptr;
  host::MemoryPool bytes_{256, 2};
};

TEST_F(MediaBufferTest, ElementsKeepTheirKindAndIndexesStayInsideTheCount) {
  uint32_t kind = 0, type = 0, low = 0, size = 0;
  uint16_t high = 0;
  EXPECT_EQ(mra_->Capacity, 4u);
  EXPECT_NE(MmfGetMraElementType(mra_, 0, &kind), 0);  // acquired empty
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 1, kMmfPropSkipMark, 0, 0), 28);  // a gap
  MmfPoolBuffer* buffer = Acquire(bytes_);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 0, kMmfPropFileOffset, 0xFFFFFFFF, 0xFFFF), 0);
  ASSERT_EQ(MmfSetMraBufferElement(mra_, 1, buffer, buffer->Data + 10, 20), 0);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 2, kMmfPropSkipMark, 1, 0), 0);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 3, kMmfPropSkipMark, 1, 0), 0);
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 4, kMmfPropSkipMark, 0, 0), 28);  // beyond the capacity
  EXPECT_EQ(MmfSetMraPropertyElement(mra_, 2, kMmfPropFrameEnd, 7, 0), 0);    // replaced, the count kept
  EXPECT_EQ(mra_->ElementCount, 4u);

  ASSERT_EQ(MmfGetMraPropertyElement(mra_, 0, &type, &low, &high), 0);
  EXPECT_EQ(type, uint32_t{kMmfPropFileOffset});
  EXPECT_EQ(MmfPropertyValue(low, high), 0xFFFFFFFFFFFFull);  // 48 bits
  ASSERT_EQ(MmfGetMraPropertyElement(mra_, 2, &type, &low, &high), 0);
  EXPECT_EQ(type, uint32_t{kMmfPropFrameEnd});
  EXPECT_EQ(low, 7u);
  MmfPoolBuffer* handle = nullptr;
  uint8_t* address = nullptr;
  EXPECT_NE(MmfGetMraBufferElement(mra_, 0, &handle, &address, &size), 0);
  EXPECT_NE(MmfGetMraPropertyElement(mra_, 1, &type, &low, &high), 0);
  ASSERT_EQ(MmfGetMraElementType(mra_, 1, &kind), 0);
  EXPECT_EQ(kind, uint32_t{kMmfElementBuffer});
  ASSERT_EQ(MmfGetMraBufferElement(mra_, 1, &handle, &address, &size), 0);
  EXPECT_EQ(std::make_tuple(handle, address, size), std::make_tuple(buffer, buffer->Data + 10, 20u));

  // Replacing the buffer element drops its reference.
  Ops().ReleaseBuffer(buffer);
  ASSERT_EQ(MmfSetMraPropertyElement(mra_, 1, kMmfPropSkipMark, 0, 0), 0);
  EXPECT_EQ(bytes_.FreeCount(), 2u);
}

// Frames of one pool buffer appended one after another share one reference;
// whatever replaces elements, the pool buffer goes back exactly when the last
// element on it is gone, and not before.
TEST_F(MediaBufferTest, ElementsOnOnePoolBufferKeepItUntilTheLastOfThemGoes) {
  enum Set { kPropertyAt, kOnA, kOnB };
  struct Step {
    Set set;
    uint32_t index;
    uint32_t a_references, b_references;  // the media buffer's, after the step
  };
  const struct {
    const char* name;
    std::vector<Step> steps;
  } cases[] = {
      {"appended frames share one", {{kOnA, 0, 1, 0}, {kPropertyAt, 1, 1, 0}, {kOnA, 2, 1, 0}, {kOnA, 3, 1, 0}}},
      {"the holder replaced: a sharer takes over",
       {{kOnA, 0, 1, 0}, {kOnA, 1, 1, 0}, {kOnA, 2, 1, 0}, {kPropertyAt, 0, 1, 0}, {kPropertyAt, 1, 1, 0},
        {kPropertyAt, 2, 0, 0}}},
      {"the holder replaced by another buffer's frame",
       {{kOnA, 0, 1, 0}, {kOnA, 1, 1, 0}, {kOnB, 0, 1, 1}, {kOnB, 1, 0, 2}}},
      {"another buffer between: each run holds its own",
       {{kOnA, 0, 1, 0}, {kOnB, 1, 1, 1}, {kOnA, 2, 2, 1}, {kPropertyAt, 0, 1, 1}, {kPropertyAt, 2, 0, 1}}},
      {"a replaced frame on the same buffer", {{kOnA, 0, 1, 0}, {kOnA, 0, 1, 0}, {kOnA, 1, 2, 0}}},
      {"the only holder replaced, then a frame appended", {{kOnA, 0, 1, 0}, {kPropertyAt, 0, 0, 0}, {kOnA, 1, 1, 0}}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    MmfPoolBuffer* a = Acquire(bytes_);
    MmfPoolBuffer* b = Acquire(bytes_);
    ASSERT_TRUE(a && b);
    for (const Step& step : c.steps) {
      SCOPED_TRACE(step.index);
      const int result = step.set == kPropertyAt ? MmfSetMraPropertyElement(mra_, step.index, kMmfPropSkipMark, 0, 0)
                         : step.set == kOnA      ? MmfSetMraBufferElement(mra_, step.index, a, a->Data + step.index, 1)
                                                 : MmfSetMraBufferElement(mra_, step.index, b, b->Data + step.index, 1);
      ASSERT_EQ(result, 0);
      EXPECT_EQ(host::BufferReferences(a), 1 + step.a_references);
      EXPECT_EQ(host::BufferReferences(b), 1 + step.b_references);
    }
    Ops().ReleaseBuffer(a);
    Ops().ReleaseBuffer(b);
    ASSERT_EQ(MmfReleaseMra(mra_), 0);
    EXPECT_EQ(bytes_.FreeCount(), 2u);  // both back, each once
    ASSERT_EQ(MmfAcquireMra(mras_, &mra_, kMmfAcquireNoWait), 0);
  }
}

TEST_F(MediaBufferTest, BufferElementMustLieInsideItsPoolBuffer) {
  MmfPoolBuffer* buffer = Acquire(bytes_);
  const struct {
    ptrdiff_t offset;
    uint32_t size;
    int result;
  } cases[] = {{0, 256, 0}, {255, 1, 0}, {256, 0, 0}, {200, 57, 22}, {-1, 1, 22}, {257, 0, 22}, {0, 257, 22}};
  for (const auto& c : cases) {
    EXPECT_EQ(MmfSetMraBufferElement(mra_, 0, buffer, buffer->Data + c.offset, c.size), c.result) << c.offset;
  }
  EXPECT_EQ(MmfSetMraBufferElement(mra_, 0, nullptr, buffer->Data, 1), 22);
  Ops().ReleaseBuffer(buffer);
}

// The zero-copy path: an output media buffer refers to an input buffer's bytes
// after the input media buffer and the producer's own reference are gone.
TEST_F(MediaBufferTest, OutputReferenceKeepsInputBytesAfterTheInputIsReleased) {
  MmfPoolBuffer* input_bytes = Acquire(bytes_);
  std::memcpy(input_bytes->Data, "frame-bytes", 11);
  MmfMra* input = nullptr;
  ASSERT_EQ(MmfAcquireMra(mras_, &input, kMmfAcquireNoWait), 0);
  ASSERT_EQ(MmfSetMraBufferElement(input, 0, input_bytes, input_bytes->Data, 256), 0);
  Ops().ReleaseBuffer(input_bytes);  // the producer keeps no reference of its own
  ASSERT_EQ(MmfSetMraBufferElement(mra_, 0, input_bytes, input_bytes->Data + 6, 5), 0);
  EXPECT_EQ(host::BufferReferences(input_bytes), 2u);
  ASSERT_EQ(MmfReleaseMra(input), 0);
  EXPECT_EQ(bytes_.FreeCount(), 1u);  // still held by the output
  EXPECT_EQ(std::memcmp(input_bytes->Data + 6, "bytes", 5), 0);
  ASSERT_EQ(MmfReleaseMra(mra_), 0);
  mra_ = nullptr;
  EXPECT_EQ(bytes_.FreeCount(), 2u);
}

TEST(MraPoolTest, PoolsAreSizedByTheChannelAndRefuseWhatTheyCannotGive) {
  MmfChannel channel{};
  channel.Format.buffer_count = 3;
  MmfMraPool* pool = nullptr;
  ASSERT_EQ(MmfAllocateMraPool(&pool, &channel, 600), 0);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 3u);
  MmfMra* mra = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &mra, 0), 0);
  EXPECT_EQ(mra->Capacity, host::kOutputBufferElements);  // a decoder's few frames, not the 600 asked for
  MmfReleaseMra(mra);
  EXPECT_EQ(MmfReleaseMra(mra), 22);  // released twice
  EXPECT_EQ(MmfFreeMraPool(pool), 0);
  channel.Format.buffer_count = 0;
  ASSERT_EQ(MmfAllocateMraPool(&pool, &channel, 8), 0);
  EXPECT_EQ(host::MraPoolFreeCount(pool), 1u);
  MmfMra* second = nullptr;
  ASSERT_EQ(MmfAcquireMra(pool, &mra, kMmfAcquireNoWait), 0);
  EXPECT_EQ(mra->Capacity, 8u);
  EXPECT_EQ(MmfAcquireMra(pool, &second, kMmfAcquireNoWait), 11);
  EXPECT_EQ(second, nullptr);

  // A media buffer outlives its freed pool and still gives back its pool buffer.
  host::MemoryPool bytes(16, 1);
  MmfPoolBuffer* buffer = Acquire(bytes);
  ASSERT_EQ(MmfSetMraBufferElement(mra, 0, buffer, buffer->Data, 16), 0);
  Ops().ReleaseBuffer(buffer);
  EXPECT_EQ(MmfFreeMraPool(pool), 0);
  EXPECT_EQ(MmfReleaseMra(mra), 0);
  EXPECT_EQ(bytes.FreeCount(), 1u);

  EXPECT_EQ(MmfAllocateMraPool(nullptr, &channel, 8), 22);
  EXPECT_EQ(MmfAllocateMraPool(&pool, nullptr, 8), 22);
  EXPECT_EQ(MmfAllocateMraPool(&pool, &channel, 0), 22);
}

}  // namespace
