// Trick-play read lists: each next request names the cluster of the cue point
// that the previous request's time, moved by TrickTime and the speed, leads to.

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "tests/plugin/graph_harness.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"

namespace {

constexpr uint32_t kForward = 512;
constexpr uint32_t kBackward = 1024;
constexpr int kNone = -1;

struct StepCase {
  const char* name;
  uint32_t mode;
  uint32_t speed;
  int from_cue;       // the previous request's cue point
  int32_t byte_rate;  // 0: unknown
  int expected_cue;   // kNone: the request ends the stream (length -1)
};

class ReadListTest : public testing::TestWithParam<StepCase> {
 protected:
  void SetUp() override {
    fixture_ = testing_support::LoadFixture("long_cues");
    connected_ = plugin_test::ConnectFile("long_cues");
    ASSERT_TRUE(connected_.graph->rated());
    ASSERT_NE(connected_.context()->ReadList, nullptr);
    std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes("long_cues");
    segment_data_ = testing_support::FirstClusterOffset(bytes.data(), bytes.size()) - fixture_.cues[0].cluster_position;
    list_maker_ = plugin_test::HostPlugin().Get<MmfListMakerOps>("MediaListMaker");
  }

  uint64_t CueTime(int i) const { return fixture_.cues[i].time_ticks * (fixture_.timecode_scale / 1000); }
  uint64_t CuePosition(int i) const { return fixture_.cues[i].cluster_position + segment_data_; }

  MmfReadListEntry* Seed(int cue, int32_t length) {
    MkvContext* context = connected_.context();
    EXPECT_EQ(MmfAcquireReadList(context->ReadList, &context->CurrentReadList), 0);
    MmfReadRequest& request = *context->CurrentReadList->Request;
    request.Time = CueTime(cue);
    request.Position = CuePosition(cue);
    request.Length = length;
    context->CurrentReadList->Ready = 1;
    return context->CurrentReadList;
  }

  MmfChannel* input() { return connected_.graph->handle()->InputChannel; }

  testing_support::FixtureExpectation fixture_;
  plugin_test::Connected connected_;
  uint64_t segment_data_ = 0;
  const MmfListMakerOps* list_maker_ = nullptr;
};

TEST_P(ReadListTest, StepLandsOnTheExpectedCuePoint) {
  const StepCase& c = GetParam();
  MkvContext* context = connected_.context();
  context->TrickMode = c.mode;
  context->TrickSpeed = c.speed;
  context->ByteRate = c.byte_rate;
  MmfReadListEntry* previous = Seed(c.from_cue, 4096);
  MmfReadListEntry* next = nullptr;
  ASSERT_EQ(list_maker_->GetNextReadList(input(), &next, previous), 0);
  ASSERT_NE(next, previous);
  EXPECT_EQ(next, context->CurrentReadList);
  EXPECT_EQ(next->Ready, 1u);
  EXPECT_EQ(next->Request->Flags, 0u);
  if (c.expected_cue == kNone) {
    EXPECT_EQ(next->Request->Length, -1);
    return;
  }
  EXPECT_EQ(next->Request->Length, 4096) << "every step reads as much as the first";
  EXPECT_EQ(next->Request->Time, CueTime(c.expected_cue));
  EXPECT_EQ(next->Request->Position, CuePosition(c.expected_cue));
}

// long_cues: a cue point every 0.5 s from 0 to 24.5 s; TrickTime 500 ms, so a
// step moves by 0.5 s + 5 ms per speed unit forward, 5 ms per unit backward.
INSTANTIATE_TEST_SUITE_P(
    Steps, ReadListTest,
    testing::Values(StepCase{"ForwardSpeed100", kForward, 100, 4, 1000, 7},
                    StepCase{"ForwardSpeed0", kForward, 0, 4, 1000, 6},
                    StepCase{"BackwardSpeed200", kBackward, 200, 10, 1000, 8},
                    StepCase{"BackwardFromTheFirst", kBackward, 200, 0, 1000, kNone},
                    StepCase{"ForwardPastTheLast", kForward, 100, 49, 1000, kNone},
                    StepCase{"UnknownByteRate", kForward, 100, 4, 0, kNone}),
    [](const testing::TestParamInfo<StepCase>& info) { return info.param.name; });

TEST_F(ReadListTest, AnEntryOtherThanTheCurrentGetsTheCurrentBackAndAcquiresNothing) {
  MmfReadListEntry* current = Seed(3, 4096);
  for (MmfReadListEntry* previous : {static_cast<MmfReadListEntry*>(nullptr), current + 1}) {
    MmfReadListEntry* out = nullptr;
    ASSERT_EQ(list_maker_->GetNextReadList(input(), &out, previous), 0);
    EXPECT_EQ(out, current);
    EXPECT_EQ(connected_.context()->CurrentReadList, current);
  }
}

}  // namespace
