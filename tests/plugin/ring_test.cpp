// The input-buffer ring driven through the plug-in by a real streamer: one of
// two acquired channels pulls alone until the ring is full.

#include <atomic>
#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "host/file_streamer.h"
#include "host/memory_pools.h"
#include "platform/mmf_status.h"
#include "tests/plugin/graph_harness.h"

namespace {

using namespace std::chrono_literals;

struct RingView {
  int32_t tail, head;
  std::vector<int> use_counts;   // of the filled slots, tail first
  std::vector<int32_t> at_slot;  // each output channel's ReadSlot
};

RingView Look(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  pthread_mutex_lock(&context->RingLock);
  RingView view{context->RingTail, context->RingHead, {}, {}};
  for (int32_t s = view.tail; s != view.head; s = (s + 1) % context->RingSize) {
    view.use_counts.push_back(context->Ring[s].use_count);
  }
  for (int32_t k = 0; k < context->OutputChannelCount; ++k) {
    view.at_slot.push_back(filter->OutputChannels[k].State->ReadSlot);
  }
  pthread_mutex_unlock(&context->RingLock);
  return view;
}

class RingTest : public testing::Test {
 protected:
  void SetUp() override {
    source_ = host::OpenFileStream(plugin_test::FixtureFile("long_cues"), true);
    streamer_ = std::make_unique<host::FileStreamer>(source_.get(), host::StreamerConfig{1000, 128});
    host::SetupOptions options;
    options.upstream = host::FileStreamer::Ops();
    options.input_pool = host::MemoryPool::Ops();
    options.input_pool_param = pool_.handle();
    options.output_pool = host::MemoryPool::Ops();
    options.output_pool_param = pool_.handle();
    connected_ = plugin_test::ConnectFile("long_cues", true, options);
    ASSERT_TRUE(connected_.graph->rated());
    ASSERT_EQ(connected_.channel_count(), 2);
    handle_ = connected_.graph->handle();
    handle_->InputChannel->Peer = streamer_->output();
    control_ = plugin_test::HostPlugin().Get<MmfMediaControlOps>("MediaControl");
    output_ = plugin_test::HostPlugin().output();
    ASSERT_EQ(control_->Start(handle_), 0);
    ASSERT_EQ(streamer_->Seek(static_cast<uint64_t>(connected_.stream->Tell()), 0), 0);
  }

  void TearDown() override {
    if (puller_.joinable()) {
      control_->Stop(handle_);
      puller_.join();
    }
    if (handle_) plugin_test::HostPlugin().Get<MmfMediaFlushOps>("MediaFlush")->Flush(handle_);
  }

  // Channel 0 pulls on its own thread until NextBuffer answers anything but 256.
  void PullAlone() {
    puller_ = std::thread([this] {
      int result;
      MmfMra* mra = nullptr;
      while ((result = output_->NextBuffer(AsFrameworkChannel(&connected_.channel(0)), &mra)) == kMmfBufferDelivered) {
        MmfReleaseMra(mra);
      }
      last_result_ = result;
    });
  }

  bool WaitUntilFull() {
    for (int i = 0; i < 500; ++i) {
      RingView view = Look(connected_.filter());
      if ((view.head + 1) % kRingSlots == view.tail) return true;
      std::this_thread::sleep_for(10ms);
    }
    return false;
  }

  host::MemoryPool pool_{65536, 8};
  std::unique_ptr<host::InputStream> source_;
  std::unique_ptr<host::FileStreamer> streamer_;
  plugin_test::Connected connected_;
  MmfFilterHandle* handle_ = nullptr;
  const MmfMediaControlOps* control_ = nullptr;
  const MmfMediaOutputOps* output_ = nullptr;
  std::thread puller_;
  std::atomic<int> last_result_{-1};
};

TEST_F(RingTest, SlotsStayUntilEveryChannelMovedPastAndAFullRingWaitsUntilStop) {
  PullAlone();
  ASSERT_TRUE(WaitUntilFull());
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(last_result_.load(), -1) << "the channel waits for room while the other holds the tail";
  RingView full = Look(connected_.filter());
  EXPECT_EQ(full.tail, 0) << "nothing is released before the second channel moves";
  ASSERT_EQ(full.use_counts.size(), static_cast<size_t>(kRingSlots - 1));
  EXPECT_EQ(full.use_counts.front(), 1) << "the first channel left the oldest slot";
  EXPECT_EQ(full.use_counts.back(), 2) << "the newest slot is still ahead of both";

  EXPECT_EQ(control_->Stop(handle_), 0);
  puller_.join();
  EXPECT_EQ(last_result_.load(), 16) << "a wait for room gives up when stopped";
}

TEST_F(RingTest, TheSecondChannelMovingOnReleasesTheOldestSlotsInOrder) {
  PullAlone();
  ASSERT_TRUE(WaitUntilFull());
  MmfMra* mra = nullptr;
  ASSERT_EQ(output_->NextBuffer(AsFrameworkChannel(&connected_.channel(1)), &mra), kMmfBufferDelivered);
  MmfReleaseMra(mra);
  // The ring has gone round since, so the tail's own index says little:
  // it must be the slot of the channel furthest behind.
  RingView after = Look(connected_.filter());
  EXPECT_TRUE(after.tail == after.at_slot[0] || after.tail == after.at_slot[1])
      << "slots both channels left went back: tail " << after.tail << ", channels at " << after.at_slot[0] << " and "
      << after.at_slot[1];
  ASSERT_FALSE(after.use_counts.empty());
  EXPECT_GT(after.use_counts.front(), 0) << "release stops at the oldest slot a channel still needs";
}

TEST_F(RingTest, FlushEmptiesTheRingAndPutsEveryCursorAtTheHead) {
  PullAlone();
  ASSERT_TRUE(WaitUntilFull());
  control_->Stop(handle_);
  puller_.join();
  plugin_test::HostPlugin().Get<MmfMediaFlushOps>("MediaFlush")->Flush(handle_);
  MkvContext* context = connected_.context();
  RingView flushed = Look(connected_.filter());
  EXPECT_EQ(flushed.tail, flushed.head);
  for (int32_t s = 0; s < kRingSlots; ++s) EXPECT_EQ(context->Ring[s].buffer, nullptr) << "slot " << s;
  for (int32_t k = 0; k < connected_.channel_count(); ++k) {
    const MkvChannelState* state = connected_.channel(k).State;
    EXPECT_EQ(state->ReadSlot, flushed.head);
    EXPECT_EQ(state->AheadSlot, flushed.head);
    EXPECT_EQ(state->ReadBuffer, nullptr);
    EXPECT_EQ(state->AheadBuffer, nullptr);
    EXPECT_EQ(state->Cluster.frame_sizes, nullptr);
  }
}

}  // namespace
