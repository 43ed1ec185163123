#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "tests/plugin/plugin_loader.h"

namespace {

using plugin_test::LoadPlugin;

class ResourcesTest : public testing::Test {
 protected:
  void SetUp() override {
    handle_ = LoadPlugin().filter().Create();
    ASSERT_NE(handle_, nullptr);
    context_ = AsMkvFilter(handle_)->Context;
  }
  void TearDown() override { LoadPlugin().filter().Destroy(handle_); }

  int Set(const char* name, int32_t value) { return LoadPlugin().resources().SetResource(handle_, name, &value); }

  const AoResource* Row(const char* name) {
    for (const AoResource* row = LoadPlugin().resources().GetResources(handle_); row && row->Name; ++row) {
      if (std::strcmp(row->Name, name) == 0) return row;
    }
    return nullptr;
  }

  int32_t Int32(const char* name) {
    const AoResource* row = Row(name);
    EXPECT_NE(row, nullptr) << name;
    return row ? *static_cast<const int32_t*>(row->Value) : 0;
  }

  MmfFilterHandle* handle_ = nullptr;
  MkvContext* context_ = nullptr;
};

struct ExpectedResource {
  const char* name;
  const char* description;
  uint32_t type;
  size_t value_offset;
};

const ExpectedResource kTable[] = {
    {"Duration", "Duration", 0x10000002, offsetof(MkvContext, Duration)},
    {"CurrentAudioTrack", "CurrentAudioTrack", 0x30000001, offsetof(MkvContext, CurrentAudioTrack)},
    {"TrackAudioLang", "TrackAudioLang", 0x10000007, offsetof(MkvContext, TrackAudioLang)},
    {"TrackCountAudio", "TrackCountAudio", 0x10000001, offsetof(MkvContext, TrackCountAudio)},
    {"CurrentVideoTrack", "CurrentVideoTrack", 0x30000001, offsetof(MkvContext, CurrentVideoTrack)},
    {"TrackVideoLang", "TrackVideoLang", 0x10000007, offsetof(MkvContext, TrackVideoLang)},
    {"TrackCountVideo", "TrackCountVideo", 0x10000001, offsetof(MkvContext, TrackCountVideo)},
    {"AVSyncDelay", "Amount of delay to add to the video", 0x30000001, offsetof(MkvContext, AVSyncDelay)},
    {"EnablePreroll", "Enable or disable preroll/roll forward on seek.", 0x30000001,
     offsetof(MkvContext, EnablePreroll)},
    {"TrickTime", "TrickTime", 0x30000001, offsetof(MkvContext, TrickTime)},
    {"TrickPlaySkipStartSpeed",
     "Parser needs to send all frames to decoder during trickplay up to this speed", 0x30000001,
     offsetof(MkvContext, TrickPlaySkipStartSpeed)},
};

TEST_F(ResourcesTest, TableHasElevenRowsWithValuesInThisInstance) {
  const AoResource* rows = LoadPlugin().resources().GetResources(handle_);
  ASSERT_NE(rows, nullptr);
  for (size_t i = 0; i < std::size(kTable); ++i) {
    SCOPED_TRACE(kTable[i].name);
    EXPECT_STREQ(rows[i].Name, kTable[i].name);
    EXPECT_STREQ(rows[i].Description, kTable[i].description);
    EXPECT_EQ(rows[i].Type, kTable[i].type);
    EXPECT_EQ(rows[i].Value, reinterpret_cast<char*>(context_) + kTable[i].value_offset);
  }
  const AoResource& end = rows[std::size(kTable)];
  EXPECT_EQ(end.Name, nullptr);
  EXPECT_EQ(end.Value, nullptr);
  EXPECT_EQ(end.Type, 0u);
}

TEST_F(ResourcesTest, RangesBoundDurationPrerollAndTrickPlay) {
  const auto* duration = static_cast<const AoResourceRange64*>(Row("Duration")->Range);
  ASSERT_NE(duration, nullptr);
  EXPECT_EQ(duration->Minimum, 0);
  EXPECT_EQ(duration->Maximum, 86400000000);
  EXPECT_EQ(duration->Step, 1);
  for (const char* name : {"AVSyncDelay", "EnablePreroll"}) {
    const auto* range = static_cast<const AoResourceRange32*>(Row(name)->Range);
    ASSERT_NE(range, nullptr) << name;
    EXPECT_EQ(range->Minimum, -2147483647) << name;
    EXPECT_EQ(range->Maximum, 2147483647) << name;
  }
  for (const char* name : {"TrickTime", "TrickPlaySkipStartSpeed"}) {
    const auto* range = static_cast<const AoResourceRange32*>(Row(name)->Range);
    ASSERT_NE(range, nullptr) << name;
    EXPECT_EQ(range->Minimum, 500) << name;
    EXPECT_EQ(range->Maximum, 1000) << name;
  }
  for (const char* name : {"CurrentAudioTrack", "TrackAudioLang", "TrackCountAudio", "CurrentVideoTrack",
                           "TrackVideoLang", "TrackCountVideo"}) {
    EXPECT_EQ(Row(name)->Range, nullptr) << name;
  }
}

TEST_F(ResourcesTest, ValuesReadThroughTheTableAreTheLiveOnes) {
  EXPECT_EQ(Int32("TrickTime"), 500);
  context_->Duration = 123456789;
  EXPECT_EQ(*static_cast<const uint64_t*>(Row("Duration")->Value), 123456789u);
  EXPECT_EQ(*static_cast<char* const*>(Row("TrackAudioLang")->Value), nullptr);
}

struct SetCase {
  const char* name;
  int32_t value;
  int result;
  const char* read_back;  // resource whose value is checked, or null
  int32_t stored;
};

const SetCase kSetCases[] = {
    {"TrickTime", 2000, 0, "TrickTime", 1000},
    {"TrickTime", 100, 0, "TrickTime", 500},
    {"TrickTime", 750, 0, "TrickTime", 750},
    {"TrickTime", -5, 0, "TrickTime", 500},
    {"TrickPlaySkipStartSpeed", 0, 0, "TrickPlaySkipStartSpeed", 500},
    {"TrickPlaySkipStartSpeed", 1001, 0, "TrickPlaySkipStartSpeed", 1000},
    {"EnablePreroll", 1, 0, "EnablePreroll", 1},
    {"EnablePreroll", -2147483647 - 1, 0, "EnablePreroll", -2147483647},
    {"EnablePreroll", 2147483647, 0, "EnablePreroll", 2147483647},
    {"Duration", 5, 1, nullptr, 0},
    {"TrackAudioLang", 5, 1, nullptr, 0},
    {"TrackCountAudio", 5, 1, "TrackCountAudio", 0},
    {"TrackCountVideo", 5, 1, "TrackCountVideo", 0},
    {"AVSyncDelay", 5, 22, "AVSyncDelay", 0},
    {"CurrentAudioTrack", 5, 22, "CurrentAudioTrack", 0},
    {"CurrentVideoTrack", 5, 22, "CurrentVideoTrack", 0},
    {"tricktime", 700, 4032, "TrickTime", 500},
    {"TRICKTIME", 700, 4032, "TrickTime", 500},
    {"TrickTime ", 700, 4032, "TrickTime", 500},
    {"", 700, 4032, "TrickTime", 500},
    {"Volume", 1, 4032, nullptr, 0},
};

TEST_F(ResourcesTest, SetResourceAnswersAndStoresPerRow) {
  for (const SetCase& c : kSetCases) {
    SCOPED_TRACE(std::string(c.name) + " = " + std::to_string(c.value));
    EXPECT_EQ(Set(c.name, c.value), c.result);
    if (c.read_back) {
      EXPECT_EQ(Int32(c.read_back), c.stored);
    }
    context_->TrickTime = 500;
    context_->TrickPlaySkipStartSpeed = 0;
    context_->EnablePreroll = 0;
  }
}

TEST_F(ResourcesTest, ReadOnlyDurationKeepsItsValue) {
  context_->Duration = 42;
  EXPECT_EQ(Set("Duration", 7), 1);
  EXPECT_EQ(context_->Duration, 42u);
}

TEST_F(ResourcesTest, HandleThatIsNotAFilterIsRefused) {
  handle_->Kind = 4;
  EXPECT_EQ(Set("TrickTime", 800), 22);
  EXPECT_EQ(LoadPlugin().resources().GetResources(handle_), nullptr);
  handle_->Kind = 2;
  EXPECT_EQ(Int32("TrickTime"), 500);
}

TEST_F(ResourcesTest, NullArgumentsAreRefused) {
  int32_t value = 800;
  const AoResourceAccessOps& ops = LoadPlugin().resources();
  EXPECT_EQ(ops.SetResource(nullptr, "TrickTime", &value), 22);
  EXPECT_EQ(ops.SetResource(handle_, nullptr, &value), 22);
  EXPECT_EQ(ops.SetResource(handle_, "TrickTime", nullptr), 22);
  EXPECT_EQ(ops.GetResources(nullptr), nullptr);
  EXPECT_EQ(Int32("TrickTime"), 500);
}

TEST_F(ResourcesTest, InstancesHaveTheirOwnValues) {
  MmfFilterHandle* other = LoadPlugin().filter().Create();
  ASSERT_NE(other, nullptr);
  int32_t value = 900;
  EXPECT_EQ(LoadPlugin().resources().SetResource(other, "TrickTime", &value), 0);
  EXPECT_EQ(Int32("TrickTime"), 500);
  EXPECT_EQ(AsMkvFilter(other)->Context->TrickTime, 900);
  LoadPlugin().filter().Destroy(other);
}

}  // namespace
