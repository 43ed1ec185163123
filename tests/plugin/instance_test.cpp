#include <cstring>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "host/heap_control.h"
#include "tests/plugin/plugin_loader.h"

namespace {

using plugin_test::LoadPlugin;

// The first two Create calls of the process, made before any test runs.
std::string first_names[2];

class FirstInstancesEnvironment : public testing::Environment {
 public:
  void SetUp() override {
    const MmfMediaFilterOps& ops = LoadPlugin().filter();
    if (!ops.Create) return;
    MmfFilterHandle* first = ops.Create();
    MmfFilterHandle* second = ops.Create();
    if (first) first_names[0] = first->Name;
    if (second) first_names[1] = second->Name;
    ops.Destroy(first);
    ops.Destroy(second);
  }
};
[[maybe_unused]] const testing::Environment* const first_instances = testing::AddGlobalTestEnvironment(new FirstInstancesEnvironment);

int InstanceNumber(const MmfFilterHandle* handle) {
  EXPECT_EQ(std::strncmp(handle->Name, "kelvane", 7), 0) << handle->Name;
  return std::atoi(handle->Name + 7);
}

TEST(CreateTest, FirstTwoInstancesOfTheProcessAreKelvane0AndKelvane1) {
  EXPECT_EQ(first_names[0], "kelvane0");
  EXPECT_EQ(first_names[1], "kelvane1");
}

TEST(CreateTest, NewInstanceHasItsHandleInputChannelAndDefaults) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  MmfFilterHandle* handle = ops.Create();
  ASSERT_NE(handle, nullptr);
  MkvFilter* filter = AsMkvFilter(handle);
  EXPECT_EQ(filter->Kind, 2u);
  EXPECT_EQ(filter->OutputChannels, nullptr);
  EXPECT_EQ(filter->Graph, nullptr);

  MkvChannel* input = filter->InputChannel;
  ASSERT_NE(input, nullptr);
  EXPECT_STREQ(input->Name, "mkvStreamIn");
  EXPECT_EQ(input->Kind, 4u);
  EXPECT_EQ(input->Direction, 1u);
  EXPECT_EQ(input->Flags, 16u);
  EXPECT_EQ(input->Filter, filter);
  EXPECT_EQ(input->Format.stream_type, 0u);
  EXPECT_EQ(input->State, nullptr);

  MkvContext* context = filter->Context;
  ASSERT_NE(context, nullptr);
  EXPECT_EQ(context->TrickTime, 500);
  EXPECT_EQ(context->TrickPlaySkipStartSpeed, 0);
  EXPECT_EQ(context->EnablePreroll, 0);
  EXPECT_EQ(context->TrackAudioLang, nullptr);
  EXPECT_EQ(context->TrackVideoLang, nullptr);
  EXPECT_EQ(context->ControlState, 0u);
  EXPECT_EQ(context->Rated, 0u);
  EXPECT_EQ(context->Ring, nullptr);
  EXPECT_EQ(context->OutputChannelCount, 0);
  EXPECT_EQ(context->Metadata, nullptr);
  EXPECT_EQ(context->EventPost, nullptr);
  ASSERT_NE(context->Resources, nullptr);
  EXPECT_EQ(ops.Destroy(handle), 0);
}

TEST(CreateTest, ConsecutiveInstancesTakeConsecutiveNumbers) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  MmfFilterHandle* a = ops.Create();
  MmfFilterHandle* b = ops.Create();
  ASSERT_TRUE(a && b);
  EXPECT_EQ(InstanceNumber(b), InstanceNumber(a) + 1);
  ops.Destroy(a);
  ops.Destroy(b);
}

TEST(CreateTest, CreatesOnSeveralThreadsGetDistinctNames) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  constexpr int kThreads = 8;
  constexpr int kPerThread = 25;
  std::vector<std::vector<MmfFilterHandle*>> made(kThreads);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&ops, &made, t] {
      for (int i = 0; i < kPerThread; ++i) made[t].push_back(ops.Create());
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::set<std::string> names;
  for (const auto& handles : made) {
    for (MmfFilterHandle* handle : handles) {
      ASSERT_NE(handle, nullptr);
      names.insert(handle->Name);
      ops.Destroy(handle);
    }
  }
  EXPECT_EQ(names.size(), size_t{kThreads * kPerThread});
}

TEST(CreateTest, EachFailedAllocationGivesNullAndLeaksNothing) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  int64_t live_before = host::LiveBlockCount();
  int failures = 0;
  MmfFilterHandle* handle = nullptr;
  for (uint64_t n = 1; n < 50 && !handle; ++n) {
    host::FailNthAllocation(n);
    handle = ops.Create();
    host::FailNthAllocation(0);
    if (!handle) {
      ++failures;
      EXPECT_EQ(host::LiveBlockCount(), live_before) << "allocation " << n << " failed";
    }
  }
  // Handle, name, context, resource table, input channel, its name.
  EXPECT_EQ(failures, 6);
  ASSERT_NE(handle, nullptr);
  EXPECT_EQ(ops.Destroy(handle), 0);
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

TEST(CreateTest, FailureAfterTheHandleStillUsesUpANumber) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  MmfFilterHandle* before = ops.Create();
  ASSERT_NE(before, nullptr);
  host::FailNthAllocation(3);  // the context
  EXPECT_EQ(ops.Create(), nullptr);
  host::FailNthAllocation(0);
  MmfFilterHandle* after = ops.Create();
  ASSERT_NE(after, nullptr);
  EXPECT_EQ(InstanceNumber(after), InstanceNumber(before) + 2);
  ops.Destroy(before);
  ops.Destroy(after);
}

TEST(DestroyTest, NullHandleAnswers22) { EXPECT_EQ(LoadPlugin().filter().Destroy(nullptr), 22); }

TEST(DestroyTest, NeverRatedInstanceFreesEverything) {
  const MmfMediaFilterOps& ops = LoadPlugin().filter();
  int64_t live_before = host::LiveBlockCount();
  MmfFilterHandle* handle = ops.Create();
  ASSERT_NE(handle, nullptr);
  EXPECT_GT(host::LiveBlockCount(), live_before);
  EXPECT_EQ(ops.Destroy(handle), 0);
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

}  // namespace
