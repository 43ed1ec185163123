// "MediaControl": how each operation moves the control state, and what
// NextBuffer answers in the states that forbid delivery.

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "tests/plugin/graph_harness.h"

namespace {

enum class Op { kStart, kStop, kPause, kResume, kStatus };

struct ControlCase {
  const char* name;
  uint32_t before;
  Op op;
  int result;  // -1: the state after (Status)
  uint32_t after;
};

int Call(const MmfMediaControlOps* control, MmfFilterHandle* handle, Op op) {
  switch (op) {
    case Op::kStart: return control->Start(handle);
    case Op::kStop: return control->Stop(handle);
    case Op::kPause: return control->Pause(handle);
    case Op::kResume: return control->Resume(handle);
    case Op::kStatus: return control->Status(handle);
  }
  return -1;
}

class MediaControlTest : public testing::TestWithParam<ControlCase> {};

TEST_P(MediaControlTest, OperationMovesTheState) {
  const ControlCase& c = GetParam();
  plugin_test::Connected connected = plugin_test::ConnectFile("tiny_avc");
  ASSERT_TRUE(connected.graph->rated());
  connected.context()->ControlState = c.before;
  const auto* control = plugin_test::HostPlugin().Get<MmfMediaControlOps>("MediaControl");
  EXPECT_EQ(Call(control, connected.graph->handle(), c.op), c.result == -1 ? static_cast<int>(c.after) : c.result);
  EXPECT_EQ(connected.context()->ControlState, c.after);
}

INSTANTIATE_TEST_SUITE_P(
    States, MediaControlTest,
    testing::Values(ControlCase{"StartFromStopped", 16, Op::kStart, 0, 64},
                    ControlCase{"ResumeFromRunning", 64, Op::kResume, 0, 256},
                    ControlCase{"PauseAfterResume", 256, Op::kPause, 0, 64},
                    ControlCase{"PauseAfterError", 1, Op::kPause, 0, 64},
                    ControlCase{"PauseWhenStoppedChangesNothing", 16, Op::kPause, 0, 16},
                    ControlCase{"StopWhenRunning", 64, Op::kStop, 0, 16},
                    ControlCase{"StopAfterErrorAnswers4041", 1, Op::kStop, 4041, 16},
                    ControlCase{"StopWhenStopped", 16, Op::kStop, 0, 16},
                    ControlCase{"StatusAnswersTheState", 256, Op::kStatus, -1, 256}),
    [](const testing::TestParamInfo<ControlCase>& info) { return info.param.name; });

TEST(MediaControlNextBufferTest, StatesBelowRunningExceptFourAreAnsweredAtOnce) {
  plugin_test::Connected connected = plugin_test::ConnectFile("tiny_avc");
  ASSERT_TRUE(connected.graph->rated());
  const MmfMediaOutputOps* output = plugin_test::HostPlugin().output();
  for (uint32_t state : {0u, 1u, 2u, 16u, 32u}) {
    connected.context()->ControlState = state;
    MmfMra* mra = reinterpret_cast<MmfMra*>(&state);
    EXPECT_EQ(output->NextBuffer(AsFrameworkChannel(&connected.channel(0)), &mra), static_cast<int>(state));
    EXPECT_EQ(mra, nullptr);
    EXPECT_EQ(connected.channel(0).State->DecoderConfigSent, 0u) << "nothing was touched";
  }
}

}  // namespace
