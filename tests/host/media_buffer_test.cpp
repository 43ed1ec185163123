// The host's memory pools and media buffers: reference-counted pool buffers,
// elements and their bounds, frames of one pool buffer sharing a reference,
// and what every framework operation and input stream of the host answers to
// a call it cannot serve. Both pools under many threads are exercised by the
// plug-in's threaded playback and control stress tests.

#include <chrono>
#include <cstring>
#include <functional>
#include <memory>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/input_streams.h"
#include "host/memory_pools.h"
#include "platform/mra_pool.h"
#include "platform/read_list.h"

namespace {

using namespace std::chrono_literals;

const MmfMemoryPoolOps& Ops() { return *host::MemoryPool::Ops(); }

MmfPoolBuffer* Acquire(host::MemoryPool& pool) {
  MmfPoolBuffer* buffer = nullptr;
  EXPECT_EQ(Ops().AcquireBuffer(pool.handle(), &buffer, 0), 0);
  return buffer;
}

// Each row is one call in turn on the same pools, media buffers, streamer and
// graph; the rows before it set the state it meets.
TEST(FrameworkAnswersTest, EveryCallGetsItsStatus) {
  auto pool = std::make_unique<host::MemoryPool>(256, 2);
  host::MemoryPool one(16, 1);
  MmfMraPool *mras = host::MakeMraPool(1, 4), *channel_pool = nullptr;
  const uint8_t file[100] = {};
  auto source = host::MakeMemoryStream(file, sizeof file, true);
  auto memory = host::MakeMemoryStream(file, sizeof file, true), pipe = host::MakeMemoryStream(file, 50, false);
  uint8_t scratch[20];
  host::FileStreamer streamer(source.get(), {10, 8});
  host::GraphClock clock;
  auto* graph = reinterpret_cast<MmfGraph*>(&clock);  // any distinct address names a graph
  MmfChannel channel{}, other{}, input{};
  channel.Format.buffer_count = 3;
  input.Kind = kMmfChannelKind;
  input.Direction = kMmfDirectionInput;
  MmfPoolBuffer *a = nullptr, *b = nullptr, *c = nullptr, *held = nullptr;
  MmfMra *mra = nullptr, *none = nullptr, *from_channel = nullptr, *small = nullptr;
  MmfReadList* list = nullptr;
  MmfClock* clock_handle = nullptr;
  const MmfClockOps* clock_ops = nullptr;
  uint32_t kind = 0, type = 0, low = 0, size = 0;
  uint16_t high = 0;
  uint8_t* address = nullptr;
  const struct {
    const char* name;
    std::function<int64_t()> call;
    int64_t result;
  } rows[] = {
      {"pool: buffer size", [&] { return Ops().BufferSize(pool->handle()); }, 256},
      {"pool: buffer count", [&] { return Ops().BufferCount(pool->handle()); }, 2},
      {"pool: first buffer", [&] { return Ops().AcquireBuffer(pool->handle(), &a, 0); }, 0},
      {"pool: second buffer", [&] { return Ops().AcquireBuffer(pool->handle(), &b, 0); }, 0},
      {"pool: none left, none handed out", [&] { return Ops().AcquireBuffer(pool->handle(), &c, 0) + 100 * (c != nullptr); }, 11},
      {"pool: buffers apart", [&] { return a->Data != b->Data && a->Pool == pool->handle(); }, 1},
      {"pool: acquire from no pool", [&] { return Ops().AcquireBuffer(nullptr, &c, 0); }, 22},
      {"pool: map no buffer", [&] { return Ops().MapBuffer(nullptr); }, 22},
      {"pool: release no mapped buffer", [&] { return Ops().ReleaseMappedBuffer(nullptr); }, 22},
      {"pool: release no buffer", [&] { return Ops().ReleaseBuffer(nullptr); }, 22},
      {"pool: free count of no pool", [&] { return Ops().FreeCount(nullptr); }, 0},
      {"media buffer: acquired", [&] { return MmfAcquireMra(mras, &mra, kMmfAcquireNoWait); }, 0},
      {"media buffer: its capacity", [&] { return mra->Capacity; }, 4},
      {"media buffer: none left, none handed out", [&] { return MmfAcquireMra(mras, &none, kMmfAcquireNoWait) + 100 * (none != nullptr); }, 11},
      {"media buffer: acquired into nothing", [&] { return MmfAcquireMra(mras, nullptr, kMmfAcquireNoWait); }, 22},
      {"media buffer: acquired empty", [&] { return MmfGetMraElementType(mra, 0, &kind) != 0; }, 1},
      {"element after a gap", [&] { return MmfSetMraPropertyElement(mra, 1, kMmfPropSkipMark, 0, 0); }, 28},
      {"element 0: a 48-bit offset", [&] { return MmfSetMraPropertyElement(mra, 0, kMmfPropFileOffset, 0xFFFFFFFF, 0xFFFF); }, 0},
      {"buffer element filling its buffer", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data, 256); }, 0},
      {"buffer element of the last byte", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data + 255, 1); }, 0},
      {"empty buffer element at the end", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data + 256, 0); }, 0},
      {"buffer element past the end", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data + 200, 57); }, 22},
      {"buffer element before the start", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data - 1, 1); }, 22},
      {"empty buffer element past the end", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data + 257, 0); }, 22},
      {"buffer element larger than its buffer", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data, 257); }, 22},
      {"buffer element of no buffer", [&] { return MmfSetMraBufferElement(mra, 1, nullptr, a->Data, 1); }, 22},
      {"buffer element 1", [&] { return MmfSetMraBufferElement(mra, 1, a, a->Data + 10, 20); }, 0},
      {"element 2", [&] { return MmfSetMraPropertyElement(mra, 2, kMmfPropSkipMark, 1, 0); }, 0},
      {"element 3", [&] { return MmfSetMraPropertyElement(mra, 3, kMmfPropSkipMark, 1, 0); }, 0},
      {"element beyond the capacity", [&] { return MmfSetMraPropertyElement(mra, 4, kMmfPropSkipMark, 0, 0); }, 28},
      {"element 2 replaced", [&] { return MmfSetMraPropertyElement(mra, 2, kMmfPropFrameEnd, 7, 0); }, 0},
      {"elements counted once", [&] { return mra->ElementCount; }, 4},
      {"property 0 read", [&] { return MmfGetMraPropertyElement(mra, 0, &type, &low, &high); }, 0},
      {"property 0 type", [&] { return type; }, kMmfPropFileOffset},
      {"property 0 has 48 bits", [&] { return int64_t(MmfPropertyValue(low, high)); }, 0xFFFFFFFFFFFF},
      {"property 2 read", [&] { return MmfGetMraPropertyElement(mra, 2, &type, &low, &high); }, 0},
      {"property 2 type and value", [&] { return type * 100 + low; }, kMmfPropFrameEnd * 100 + 7},
      {"property 0 is no buffer", [&] { return MmfGetMraBufferElement(mra, 0, &c, &address, &size) != 0; }, 1},
      {"buffer 1 is no property", [&] { return MmfGetMraPropertyElement(mra, 1, &type, &low, &high) != 0; }, 1},
      {"buffer 1 kind", [&] { return MmfGetMraElementType(mra, 1, &kind); }, 0},
      {"buffer 1 is a buffer", [&] { return kind; }, kMmfElementBuffer},
      {"buffer 1 read", [&] { return MmfGetMraBufferElement(mra, 1, &c, &address, &size); }, 0},
      {"buffer 1 as set", [&] { return c == a && address == a->Data + 10 && size == 20; }, 1},
      {"buffer 1 holds a reference", [&] { return host::BufferReferences(a); }, 2},
      {"the acquirer's reference back", [&] { return Ops().ReleaseBuffer(a); }, 0},
      {"still held by the element", [&] { return Ops().FreeCount(pool->handle()); }, 0},
      {"replacing the buffer element drops it", [&] { return MmfSetMraPropertyElement(mra, 1, kMmfPropSkipMark, 0, 0); }, 0},
      {"back in its pool", [&] { return Ops().FreeCount(pool->handle()); }, 1},
      {"a buffer back in its pool, dropped again", [&] { return host::DropBufferReference(a), Ops().FreeCount(pool->handle()); }, 1},
      {"the buffer given back comes again", [&] { return Ops().AcquireBuffer(pool->handle(), &c, 0) + (c != a); }, 0},
      {"mapped", [&] { return Ops().MapBuffer(a); }, 0},
      {"mapped and released", [&] { return Ops().ReleaseMappedBuffer(a); }, 0},
      {"back after mapping", [&] { return Ops().FreeCount(pool->handle()); }, 1},
      {"a buffer outlives its pool", [&] { return std::memset(b->Data, 0x5A, 256), pool.reset(), b->Data[255]; }, 0x5A},
      {"and is given back after it", [&] { return Ops().ReleaseBuffer(b); }, 0},
      {"media buffer released", [&] { return MmfReleaseMra(mra); }, 0},
      {"media buffer released twice", [&] { return MmfReleaseMra(mra); }, 22},
      {"channel pool: no pool pointer", [&] { return MmfAllocateMraPool(nullptr, &channel, 8); }, 22},
      {"channel pool: no channel", [&] { return MmfAllocateMraPool(&channel_pool, nullptr, 8); }, 22},
      {"channel pool: no capacity", [&] { return MmfAllocateMraPool(&channel_pool, &channel, 0); }, 22},
      {"channel pool", [&] { return MmfAllocateMraPool(&channel_pool, &channel, 600); }, 0},
      {"channel pool: as many as the format's buffers", [&] { return host::MraPoolFreeCount(channel_pool); }, 3},
      {"channel pool: a buffer", [&] { return MmfAcquireMra(channel_pool, &from_channel, 0); }, 0},
      {"channel pool: a decoder's few frames, not the 600 asked for", [&] { return from_channel->Capacity; }, host::kOutputBufferElements},
      {"channel pool: a pool buffer", [&] { return (held = Acquire(one)) != nullptr; }, 1},
      {"channel pool: buffer on the pool buffer", [&] { return MmfSetMraBufferElement(from_channel, 0, held, held->Data, 16); }, 0},
      {"channel pool: the pool buffer's acquirer lets go", [&] { return Ops().ReleaseBuffer(held); }, 0},
      {"channel pool: freed before its buffer", [&] { return MmfFreeMraPool(channel_pool); }, 0},
      {"channel pool: its buffer released after", [&] { return MmfReleaseMra(from_channel); }, 0},
      {"channel pool: which gives back its pool buffer", [&] { return one.FreeCount(); }, 1},
      {"channel pool: when the format names no buffers", [&] { return channel.Format.buffer_count = 0, MmfAllocateMraPool(&channel_pool, &channel, 8); }, 0},
      {"channel pool: one buffer", [&] { return host::MraPoolFreeCount(channel_pool); }, 1},
      {"channel pool: its one buffer", [&] { return MmfAcquireMra(channel_pool, &small, kMmfAcquireNoWait); }, 0},
      {"channel pool: of the capacity asked for", [&] { return small->Capacity; }, 8},
      {"channel pool: no second", [&] { return MmfAcquireMra(channel_pool, &none, kMmfAcquireNoWait); }, 11},
      {"channel pool: its one buffer released", [&] { return MmfReleaseMra(small); }, 0},
      {"channel pool: freed", [&] { return MmfFreeMraPool(channel_pool); }, 0},
      {"streamer: next buffer of another channel", [&] { return host::FileStreamer::Ops()->NextBuffer(&other, &mra); }, 22},
      {"streamer: next buffer into nothing", [&] { return host::FileStreamer::Ops()->NextBuffer(streamer.output(), nullptr); }, 22},
      {"streamer: found by its output", [&] { return host::FileStreamer::OfOutput(streamer.output()) == &streamer; }, 1},
      {"streamer: list mode without a list maker", [&] { return streamer.SetListMode(1); }, 4044},
      {"read list allocated", [&] { return MmfAllocateReadlist(&list, &input, 2, 2); }, 0},
      {"read list: list mode of an unconnected channel", [&] { return MmfStreamerSetListMode(list, 1); }, 4044},
      {"read list: list mode of no list", [&] { return MmfStreamerSetListMode(nullptr, 1); }, 22},
      {"read list freed", [&] { return MmfFreeReadlist(list); }, 0},
      {"input: a pipe read", [&] { return pipe->Read(scratch, 10); }, 10},
      {"input: a pipe reads nothing alongside behind it", [&] { return pipe->ReadAtAlongside(0, scratch, 10); }, -1},
      {"input: memory read alongside, staying", [&] { return memory->ReadAtAlongside(90, scratch, 20) + memory->Tell(); }, 10},
      {"input: no such file", [&] { return host::OpenFileStream("/nonexistent/kelvane.mkv", true) == nullptr; }, 1},
      {"graph clock: none attached", [&] { return MmfGetGraphClock(graph, &clock_handle, &clock_ops); }, 4044},
      {"graph clock: no graph", [&] { return MmfGetGraphClock(nullptr, &clock_handle, &clock_ops); }, 22},
      {"graph clock: attached", [&] { return host::AttachGraphClock(graph, &clock), MmfGetGraphClock(graph, &clock_handle, &clock_ops); }, 0},
      {"graph clock: the media time consumed", [&] { return clock.Consumed(7250000), int64_t(clock_ops->GetTime(clock_handle, 0, 1, 0, 0, 0)); }, 7250000},
      {"graph clock: detached", [&] { return host::AttachGraphClock(graph, nullptr), MmfGetGraphClock(graph, &clock_handle, &clock_ops); }, 4044},
  };
  for (const auto& row : rows) EXPECT_EQ(row.call(), row.result) << row.name;
  MmfFreeMraPool(mras);
}

TEST(MemoryPoolTest, WaitingAcquiresGetWhatAnotherThreadReleases) {
  host::MemoryPool pool(8, 1);
  MmfMraPool* mras = host::MakeMraPool(1, 1);
  MmfPoolBuffer* held = pool.AcquireWaiting(0ms);
  MmfMra *mra = nullptr, *again = nullptr;
  ASSERT_TRUE(held && MmfAcquireMra(mras, &mra, 0) == 0);
  EXPECT_EQ(pool.AcquireWaiting(1ms), nullptr);
  // Each is released 20 ms after the wait for it began.
  std::thread releaser([held, mra] {
    std::this_thread::sleep_for(20ms);
    Ops().ReleaseBuffer(held);
    std::this_thread::sleep_for(20ms);
    MmfReleaseMra(mra);
  });
  EXPECT_EQ(pool.AcquireWaiting(5s), held);
  EXPECT_EQ(MmfAcquireMra(mras, &again, 0), 0);
  releaser.join();
  EXPECT_EQ(again, mra);
  Ops().ReleaseBuffer(held);
  MmfReleaseMra(again);
  MmfFreeMraPool(mras);
}

// Frames of one pool buffer appended one after another share one reference;
// whatever replaces elements, the pool buffer goes back exactly when the last
// element on it is gone, and not before.
TEST(MediaBufferTest, ElementsOnOnePoolBufferKeepItUntilTheLastOfThemGoes) {
  MmfMraPool* mras = host::MakeMraPool(1, 4);
  host::MemoryPool bytes(256, 2);
  // A property ('p') or a one-byte frame on buffer 'a' or 'b' set at the index; the
  // references the media buffer holds on a and b afterwards.
  struct Step { char set; uint32_t index, a_references, b_references; };
  const struct { const char* name; std::vector<Step> steps; } cases[] = {
      {"appended frames share one", {{'a', 0, 1, 0}, {'p', 1, 1, 0}, {'a', 2, 1, 0}, {'a', 3, 1, 0}}},
      {"the holder replaced: a sharer takes over",
       {{'a', 0, 1, 0}, {'a', 1, 1, 0}, {'a', 2, 1, 0}, {'p', 0, 1, 0}, {'p', 1, 1, 0}, {'p', 2, 0, 0}}},
      {"the holder replaced by another buffer's frame", {{'a', 0, 1, 0}, {'a', 1, 1, 0}, {'b', 0, 1, 1}, {'b', 1, 0, 2}}},
      {"another buffer between: each run holds its own",
       {{'a', 0, 1, 0}, {'b', 1, 1, 1}, {'a', 2, 2, 1}, {'p', 0, 1, 1}, {'p', 2, 0, 1}}},
      {"a replaced frame on the same buffer", {{'a', 0, 1, 0}, {'a', 0, 1, 0}, {'a', 1, 2, 0}}},
      {"the only holder replaced, then a frame appended", {{'a', 0, 1, 0}, {'p', 0, 0, 0}, {'a', 1, 1, 0}}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    MmfPoolBuffer *a = Acquire(bytes), *b = Acquire(bytes);
    MmfMra* mra = nullptr;
    ASSERT_TRUE(a && b && MmfAcquireMra(mras, &mra, kMmfAcquireNoWait) == 0);
    for (const Step& step : c.steps) {
      SCOPED_TRACE(step.index);
      MmfPoolBuffer* on = step.set == 'a' ? a : b;
      ASSERT_EQ(step.set == 'p' ? MmfSetMraPropertyElement(mra, step.index, kMmfPropSkipMark, 0, 0)
                                : MmfSetMraBufferElement(mra, step.index, on, on->Data + step.index, 1), 0);
      EXPECT_EQ(host::BufferReferences(a), 1 + step.a_references);
      EXPECT_EQ(host::BufferReferences(b), 1 + step.b_references);
    }
    Ops().ReleaseBuffer(a);
    Ops().ReleaseBuffer(b);
    ASSERT_EQ(MmfReleaseMra(mra), 0);
    EXPECT_EQ(bytes.FreeCount(), 2u);  // both back, each once
  }
  MmfFreeMraPool(mras);
}

}  // namespace
