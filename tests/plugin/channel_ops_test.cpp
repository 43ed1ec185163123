// The order rules of the input and output channel operations, and their
// error codes, on a rated two-channel stream.

#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/call_failures.h"
#include "host/memory_pools.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/log_recorder.h"

namespace {

using host::FrameworkCall;
using plugin_test::Connected;
using plugin_test::HostPlugin;

enum class Op { kAcquire, kRelease, kSetFormat, kSetPool, kNextBuffer, kReadList };

constexpr int kInjected = 12;

struct Step {
  Op op;
  int result;
  FrameworkCall fail = FrameworkCall::kCount;  // made to answer kInjected during the step
  const char* log = nullptr;                   // then logged at level 2
};

struct Sequence {
  const char* name;
  std::vector<Step> steps;
  const char* fixture = "avc_aac";
  int32_t channel = 0;
};

// avc_aac (unless named) offers two channels; nothing is acquired by the set-up.
Connected Unconfigured(const char* fixture = "avc_aac") {
  host::SetupOptions options;
  options.configure_outputs = false;
  return plugin_test::ConnectFile(fixture, true, options);
}

TEST(OutputChannelOrderTest, EachOperationAnswersByTheChannelState) {
  const std::vector<Sequence> sequences = {
      {"nothing before acquisition", {{Op::kSetFormat, 4014}, {Op::kSetPool, 4014}, {Op::kRelease, 4015}}},
      {"acquire twice", {{Op::kAcquire, 0}, {Op::kAcquire, 4013}, {Op::kRelease, 0}, {Op::kRelease, 4015}}},
      {"pool needs a format", {{Op::kAcquire, 0}, {Op::kSetPool, 4017}, {Op::kRelease, 0}}},
      {"format once per lifetime",
       {{Op::kAcquire, 0}, {Op::kSetFormat, 0}, {Op::kSetFormat, 4016}, {Op::kRelease, 0}, {Op::kAcquire, 0},
        {Op::kSetFormat, 4016}, {Op::kSetPool, 0}, {Op::kRelease, 0}}},
      // The record counted for the encrypted track: nothing to play, every operation refused.
      {"a record without a track",
       {{Op::kAcquire, 4044}, {Op::kSetFormat, 4044}, {Op::kSetPool, 4044}, {Op::kNextBuffer, 4044},
        {Op::kReadList, 4044}, {Op::kRelease, 4044}},
       "encrypted_aac", 1},
      // A failed acquisition stays acquired without a read list.
      {"read list allocation fails",
       {{Op::kAcquire, kInjected, FrameworkCall::kAllocateReadlist,
         "kelvane: AcquireOutputChannel MmfAllocateReadlist() failed err = 12"},
        {Op::kRelease, 0}}},
      {"media buffer acquisition fails",
       {{Op::kAcquire, 0}, {Op::kSetFormat, 0}, {Op::kSetPool, 0},
        {Op::kNextBuffer, 1, FrameworkCall::kAcquireMra, "kelvane->MmfAcquireMra() failed"}, {Op::kRelease, 0}}},
  };
  const MmfMediaOutputOps& ops = *HostPlugin().output();
  host::MemoryPool pool(4096, 4);
  for (const Sequence& sequence : sequences) {
    SCOPED_TRACE(sequence.name);
    Connected c = Unconfigured(sequence.fixture);
    ASSERT_EQ(c.channel_count(), 2);
    MmfChannel* channel = AsFrameworkChannel(&c.channel(sequence.channel));
    MmfMediaFormat format = c.channel(0).Format;
    c.context()->ControlState = 64;  // as after Start
    for (size_t i = 0; i < sequence.steps.size(); ++i) {
      const Step& step = sequence.steps[i];
      int32_t acquired_before = c.context()->AcquiredChannelCount;
      int result = -1;
      MmfMra* mra = reinterpret_cast<MmfMra*>(&format);
      MmfReadListEntry* entry = nullptr;
      testing_support::LogRecorder log;
      if (step.log) host::FailNextCall(step.fail, kInjected);
      switch (step.op) {
        case Op::kAcquire: result = ops.AcquireOutputChannel(channel); break;
        case Op::kRelease: result = ops.ReleaseOutputChannel(channel); break;
        case Op::kSetFormat: result = ops.SetOutputFormat(channel, &format); break;
        case Op::kSetPool: result = ops.SetOutputChannelMemoryPool(channel, host::MemoryPool::Ops(), pool.handle()); break;
        case Op::kNextBuffer: result = ops.NextBuffer(channel, &mra); break;
        case Op::kReadList:
          result = HostPlugin().Get<MmfListMakerOps>("MediaListMaker")->GetNextReadList(channel, &entry, nullptr);
          break;
      }
      EXPECT_EQ(result, step.result) << "step " << i;
      if (step.log) {
        host::FailNextCall(step.fail, 0);
        EXPECT_TRUE(log.Contains(2, step.log)) << "step " << i;
      }
      if (result == 4044) {
        const char* names[] = {"AcquireOutputChannel", "ReleaseOutputChannel", "SetOutputFormat",
                               "SetOutputChannelMemoryPool", "NextBuffer", "GetNextReadList"};
        EXPECT_TRUE(log.Contains(2, std::string("kelvane: ") + names[int(step.op)] +
                                        " channel 1 has no track: track 2 is encrypted."))
            << "step " << i;
        EXPECT_EQ(mra == nullptr, step.op == Op::kNextBuffer) << "step " << i;
        EXPECT_EQ(c.context()->RingHead, 0) << "the ring is not touched";
      }
      const MkvChannelState& state = *c.channel(sequence.channel).State;
      EXPECT_EQ(state.Acquired, (c.channel(sequence.channel).Flags & 1) ? 1u : 0u) << "step " << i;
      EXPECT_EQ(c.context()->ReadList != nullptr, state.Acquired == 1 && step.fail != FrameworkCall::kAllocateReadlist)
          << "step " << i;
      if (step.op == Op::kSetPool) {
        EXPECT_EQ(state.MraPool != nullptr, result == 0) << "step " << i;
      }
      if (step.result != 0 && !step.log) {
        EXPECT_EQ(c.context()->AcquiredChannelCount, acquired_before) << "step " << i;
      }
    }
    EXPECT_EQ(c.context()->AcquiredChannelCount, 0);
  }
}

TEST(OutputChannelOrderTest, NullArgumentsAnswer22) {
  const MmfMediaOutputOps& ops = *HostPlugin().output();
  Connected c = Unconfigured();
  MmfChannel* channel = AsFrameworkChannel(&c.channel(0));
  MmfMediaFormat format{};
  int32_t iterator = 0;
  host::MemoryPool pool(4096, 1);
  EXPECT_EQ(ops.AcquireOutputChannel(nullptr), 22);
  EXPECT_EQ(ops.ReleaseOutputChannel(nullptr), 22);
  EXPECT_EQ(ops.SetOutputFormat(channel, nullptr), 22);
  EXPECT_EQ(ops.IterateOutputFormats(channel, &format, nullptr), 22);
  EXPECT_EQ(ops.IterateOutputFormats(nullptr, &format, &iterator), 22);
  EXPECT_EQ(ops.SetOutputChannelMemoryPool(channel, nullptr, pool.handle()), 22);
  EXPECT_EQ(ops.SetOutputChannelMemoryPool(channel, host::MemoryPool::Ops(), nullptr), 22);
  EXPECT_EQ(ops.IterateOutputChannels(c.graph->handle(), nullptr), nullptr);
  EXPECT_EQ(ops.IterateOutputChannels(nullptr, &iterator), nullptr);
}

// The set-up's walk over the channels and their formats (one format per
// channel, as many times as there are channels) is pinned by the rating of
// every fixture, the offered format's fields too.
TEST(OutputChannelListTest, ChannelsAreListedFromTheIteratorAndFormatsMatchOnTheBufferSize) {
  const MmfMediaOutputOps& ops = *HostPlugin().output();
  Connected c = Unconfigured();
  int32_t iterator = 1;
  MmfChannel* second = AsFrameworkChannel(&c.channel(1));
  EXPECT_EQ(ops.IterateOutputChannels(c.graph->handle(), &iterator), second);
  EXPECT_EQ(ops.IterateOutputChannels(c.graph->handle(), &iterator), nullptr);
  EXPECT_EQ(iterator, 2);
  MmfMediaFormat offered = c.graph->outputs()[1].offered, other = offered;
  EXPECT_EQ(c.channel(1).Format.buffer_count, 0u) << "the ring's buffers are added to the copy offered";
  EXPECT_EQ(ops.VerifyOutputFormat(second, &offered, &other), 100);
  other.buffer_size += 1;
  EXPECT_EQ(ops.VerifyOutputFormat(second, &offered, &other), 0);
  EXPECT_EQ(ops.VerifyOutputFormat(second, &offered, nullptr), 0);
}

// Then an output channel's frame prefix buffer, from that input pool, goes
// back to it once at the channel's release.
TEST(InputChannelOrderTest, FormatThenMediaOutputThenPoolWhoseFramePrefixBufferReleaseGivesBackOnce) {
  const MmfMediaInputOps& ops = *HostPlugin().input();
  static const MmfMediaOutputOps upstream{};
  host::MemoryPool pool(64, 2);
  Connected c = Unconfigured();
  MmfChannel* input = c.graph->handle()->InputChannel;
  MmfMediaFormat format = c.graph->input_format();

  input->Flags &= ~1u;  // as if the framework had not acquired it
  EXPECT_EQ(ops.SetInputFormat(input, &format), 4009);
  EXPECT_EQ(ops.SetInputChannelMemoryPool(input, host::MemoryPool::Ops(), pool.handle()), 4009);
  input->Flags |= 1u;
  EXPECT_EQ(ops.SetInputChannelMemoryPool(input, host::MemoryPool::Ops(), pool.handle()), 4012);
  EXPECT_EQ(ops.SetInputFormat(input, nullptr), 22);
  EXPECT_EQ(ops.SetInputFormat(input, &format), 0);
  EXPECT_EQ(ops.SetMediaOutput(input, nullptr), 22);
  EXPECT_EQ(ops.SetMediaOutput(input, &upstream), 0);
  EXPECT_EQ(ops.SetInputFormat(input, &format), 4011);
  EXPECT_EQ(ops.SetInputChannelMemoryPool(input, nullptr, pool.handle()), 22);
  EXPECT_EQ(ops.SetInputChannelMemoryPool(input, host::MemoryPool::Ops(), pool.handle()), 0);
  EXPECT_EQ(c.context()->MediaOutput, &upstream);
  EXPECT_EQ(c.context()->InputPoolParam, pool.handle());

  const MmfMediaOutputOps& output = *HostPlugin().output();
  MmfChannel* channel = AsFrameworkChannel(&c.channel(0));
  for (int round = 0; round < 2; ++round) {
    SCOPED_TRACE(round);
    ASSERT_EQ(output.AcquireOutputChannel(channel), 0);
    if (round == 0) {
      MmfPoolBuffer* prefix = nullptr;
      ASSERT_EQ(host::MemoryPool::Ops()->AcquireBuffer(pool.handle(), &prefix, 0), 0);
      host::MemoryPool::Ops()->MapBuffer(prefix);
      c.channel(0).State->ConfigBuffer = prefix;
    }
    ASSERT_EQ(output.ReleaseOutputChannel(channel), 0);
    EXPECT_EQ(pool.FreeCount(), 2u);
    EXPECT_EQ(c.channel(0).State->ConfigBuffer, nullptr);
  }
}

}  // namespace
