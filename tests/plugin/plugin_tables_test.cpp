// What the framework sees before any stream: the exported `interfaces` rows,
// Create and Destroy, the resource table and the event producer.

#include <dlfcn.h>

#include <cstring>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "filter/mkv_context.h"
#include "host/heap_control.h"
#include "tests/plugin/graph_harness.h"

namespace {

using plugin_test::HostPlugin;

const MmfMediaFilterOps& Filter() { return *HostPlugin().filter(); }

// The first two Create calls of the process, made before any test runs.
std::string first_names[2];

struct FirstInstancesEnvironment : testing::Environment {
  void SetUp() override {
    MmfFilterHandle* const made[2] = {Filter().Create(), Filter().Create()};
    for (int i = 0; i < 2; ++i) {
      first_names[i] = made[i] ? made[i]->Name : "";
      Filter().Destroy(made[i]);
    }
  }
};
[[maybe_unused]] const testing::Environment* const first_instances =
    testing::AddGlobalTestEnvironment(new FirstInstancesEnvironment);

struct ExpectedRow {
  const char* name;
  int32_t version;
  size_t slots;  // function pointers in the table
};

const ExpectedRow kRows[] = {
    {"MediaFilter", 110, 2},        {"MediaInput", 101, 7},       {"MediaOutput", 101, 8},
    {"MediaFlush", 100, 1},         {"MediaTimeConverter", 100, 2}, {"MediaSeeker", 102, 2},
    {"AOStreamInspector", 100, 1},  {"AOResourceAccess", 100, 2}, {"MediaControl", 101, 5},
    {"MediaEventProducer", 100, 3}, {"MediaSetInputPosition", 100, 1}, {"MediaTrickPlay", 100, 4},
    {"MediaListMaker", 100, 1},     {"MediaMetadataParser", 100, 5},
};

// Name, Version, the tables in the framework's order with every slot filled
// (except MediaInput's first three), then a row of zeros. The library stays
// open: dlopen of the same path is the plug-in the other tests use.
TEST(InterfacesTest, RowsComeInTheFrameworkOrderWithEverySlotFilled) {
  void* library = dlopen(KELVANE_PLUGIN_PATH, RTLD_NOW | RTLD_LOCAL);
  ASSERT_NE(library, nullptr) << dlerror();
  const auto* rows = static_cast<const AoInterface*>(dlsym(library, AO_INTERFACES_SYMBOL));
  ASSERT_NE(rows, nullptr);
  EXPECT_STREQ(rows[0].Name, "Name");
  EXPECT_EQ(rows[0].Version, 1);
  EXPECT_STREQ(static_cast<const char*>(rows[0].Interface), "kelvane");
  EXPECT_STREQ(rows[1].Name, "Version");
  EXPECT_EQ(rows[1].Version, 100);
  EXPECT_EQ(rows[1].Interface, nullptr);
  for (size_t i = 0; i < std::size(kRows); ++i) {
    SCOPED_TRACE(kRows[i].name);
    const AoInterface& row = rows[i + 2];
    EXPECT_STREQ(row.Name, kRows[i].name);
    EXPECT_EQ(row.Version, kRows[i].version);
    ASSERT_NE(row.Interface, nullptr);
    const auto* slots = static_cast<void* const*>(row.Interface);
    for (size_t slot = 0; slot < kRows[i].slots; ++slot) {
      const bool reserved = std::strcmp(kRows[i].name, "MediaInput") == 0 && slot < 3;
      EXPECT_EQ(slots[slot] == nullptr, reserved) << "slot " << slot;
    }
  }
  const AoInterface& end = rows[2 + std::size(kRows)];
  EXPECT_TRUE(end.Name == nullptr && end.Version == 0 && end.Interface == nullptr);
}

int InstanceNumber(const MmfFilterHandle* handle) {
  EXPECT_EQ(std::strncmp(handle->Name, "kelvane", 7), 0) << handle->Name;
  return std::atoi(handle->Name + 7);
}

TEST(CreateTest, InstancesAreNumberedFromKelvane0WithTheirInputChannelAndDefaults) {
  EXPECT_EQ(first_names[0], "kelvane0");
  EXPECT_EQ(first_names[1], "kelvane1");
  MmfFilterHandle* handle = Filter().Create();
  ASSERT_NE(handle, nullptr);
  MmfFilterHandle* next = Filter().Create();
  ASSERT_NE(next, nullptr);
  EXPECT_EQ(InstanceNumber(next), InstanceNumber(handle) + 1);
  MkvFilter* filter = AsMkvFilter(handle);
  EXPECT_EQ(filter->Kind, 2u);
  const MkvChannel* input = filter->InputChannel;
  ASSERT_NE(input, nullptr);
  EXPECT_STREQ(input->Name, "mkvStreamIn");
  EXPECT_EQ(input->Kind, 4u);
  EXPECT_EQ(input->Direction, 1u);
  EXPECT_EQ(input->Flags, 16u);
  EXPECT_EQ(input->Filter, filter);
  const MkvContext* context = filter->Context;
  ASSERT_NE(context, nullptr);
  EXPECT_EQ(context->TrickTime, 500);
  EXPECT_EQ(context->ControlState, 0u);
  EXPECT_NE(context->Resources, nullptr);
  EXPECT_EQ(Filter().Destroy(handle), 0);
  EXPECT_EQ(Filter().Destroy(next), 0);
  EXPECT_EQ(Filter().Destroy(nullptr), 22);
}

TEST(CreateTest, CreatesOnSeveralThreadsGetDistinctNames) {
  constexpr int kThreads = 8, kPerThread = 25;
  std::vector<std::vector<MmfFilterHandle*>> made(kThreads);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&made, t] {
      for (int i = 0; i < kPerThread; ++i) made[t].push_back(Filter().Create());
    });
  }
  for (std::thread& thread : threads) thread.join();
  std::set<std::string> names;
  for (const auto& handles : made) {
    for (MmfFilterHandle* handle : handles) {
      ASSERT_NE(handle, nullptr);
      names.insert(handle->Name);
      Filter().Destroy(handle);
    }
  }
  EXPECT_EQ(names.size(), size_t{kThreads * kPerThread});
}

// A failed Create gives null (its leaks: the playback allocation sweeps);
// one after the handle (the context) still uses up an instance number.
TEST(CreateTest, FailedAllocationAfterTheHandleUsesUpAnInstanceNumber) {
  MmfFilterHandle* handle = Filter().Create();
  host::FailNthAllocation(3);
  EXPECT_EQ(Filter().Create(), nullptr);
  host::FailNthAllocation(0);
  MmfFilterHandle* after = Filter().Create();
  ASSERT_TRUE(handle && after);
  EXPECT_EQ(InstanceNumber(after), InstanceNumber(handle) + 2);
  EXPECT_EQ(Filter().Destroy(handle), 0);
  EXPECT_EQ(Filter().Destroy(after), 0);
}

class ResourcesTest : public testing::Test {
 protected:
  void SetUp() override {
    handle_ = Filter().Create();
    ASSERT_NE(handle_, nullptr);
    context_ = AsMkvFilter(handle_)->Context;
  }
  void TearDown() override { Filter().Destroy(handle_); }

  const AoResourceAccessOps& Ops() { return *HostPlugin().resources(); }
  int Set(const char* name, int32_t value) { return Ops().SetResource(handle_, name, &value); }

  MmfFilterHandle* handle_ = nullptr;
  MkvContext* context_ = nullptr;
};

struct ExpectedResource {
  const char* name;
  const char* description;
  uint32_t type;
  size_t value_offset;
  int64_t minimum, maximum;  // 0, 0: no range
};

constexpr int64_t kMax32 = 2147483647;
const ExpectedResource kResources[] = {
    {"Duration", "Duration", 0x10000002, offsetof(MkvContext, Duration), 0, 86400000000},
    {"CurrentAudioTrack", "CurrentAudioTrack", 0x30000001, offsetof(MkvContext, CurrentAudioTrack), 0, 0},
    {"TrackAudioLang", "TrackAudioLang", 0x10000007, offsetof(MkvContext, TrackAudioLang), 0, 0},
    {"TrackCountAudio", "TrackCountAudio", 0x10000001, offsetof(MkvContext, TrackCountAudio), 0, 0},
    {"CurrentVideoTrack", "CurrentVideoTrack", 0x30000001, offsetof(MkvContext, CurrentVideoTrack), 0, 0},
    {"TrackVideoLang", "TrackVideoLang", 0x10000007, offsetof(MkvContext, TrackVideoLang), 0, 0},
    {"TrackCountVideo", "TrackCountVideo", 0x10000001, offsetof(MkvContext, TrackCountVideo), 0, 0},
    {"AVSyncDelay", "Amount of delay to add to the video", 0x30000001, offsetof(MkvContext, AVSyncDelay), -kMax32,
     kMax32},
    {"EnablePreroll", "Enable or disable preroll/roll forward on seek.", 0x30000001,
     offsetof(MkvContext, EnablePreroll), -kMax32, kMax32},
    {"TrickTime", "TrickTime", 0x30000001, offsetof(MkvContext, TrickTime), 500, 1000},
    {"TrickPlaySkipStartSpeed", "Parser needs to send all frames to decoder during trickplay up to this speed",
     0x30000001, offsetof(MkvContext, TrickPlaySkipStartSpeed), 500, 1000},
};

// Eleven rows whose values live in this instance's context, then a row of zeros.
TEST_F(ResourcesTest, TableRowsPointIntoThisInstanceWithTheirRanges) {
  const AoResource* rows = Ops().GetResources(handle_);
  ASSERT_NE(rows, nullptr);
  for (size_t i = 0; i < std::size(kResources); ++i) {
    const ExpectedResource& want = kResources[i];
    SCOPED_TRACE(want.name);
    EXPECT_STREQ(rows[i].Name, want.name);
    EXPECT_STREQ(rows[i].Description, want.description);
    EXPECT_EQ(rows[i].Type, want.type);
    EXPECT_EQ(rows[i].Value, reinterpret_cast<char*>(context_) + want.value_offset);
    ASSERT_EQ(rows[i].Range != nullptr, want.maximum != 0);
    if (!rows[i].Range) continue;
    const auto* wide = want.type == 0x10000002 ? static_cast<const AoResourceRange64*>(rows[i].Range) : nullptr;
    const auto* narrow = static_cast<const AoResourceRange32*>(rows[i].Range);
    EXPECT_EQ(wide ? wide->Minimum : narrow->Minimum, want.minimum);
    EXPECT_EQ(wide ? wide->Maximum : narrow->Maximum, want.maximum);
    EXPECT_EQ(wide ? wide->Step : 1, 1);
  }
  const AoResource& end = rows[std::size(kResources)];
  EXPECT_TRUE(end.Name == nullptr && end.Value == nullptr && end.Type == 0);
}

// Each row's value is read back from the context field that its resource row points to.
struct SetCase {
  const char* name;
  int32_t value;
  int result;
  int32_t MkvContext::*read_back;  // or null
  int32_t stored;
};

const SetCase kSetCases[] = {
    {"TrickTime", 2000, 0, &MkvContext::TrickTime, 1000}, {"TrickTime", 750, 0, &MkvContext::TrickTime, 750},
    {"TrickTime", -5, 0, &MkvContext::TrickTime, 500},
    {"TrickPlaySkipStartSpeed", 0, 0, &MkvContext::TrickPlaySkipStartSpeed, 500},
    {"TrickPlaySkipStartSpeed", 1001, 0, &MkvContext::TrickPlaySkipStartSpeed, 1000},
    {"EnablePreroll", -kMax32 - 1, 0, &MkvContext::EnablePreroll, -kMax32},
    {"EnablePreroll", kMax32, 0, &MkvContext::EnablePreroll, kMax32}, {"Duration", 5, 1, nullptr, 0},
    {"TrackAudioLang", 5, 1, nullptr, 0}, {"TrackCountAudio", 5, 1, &MkvContext::TrackCountAudio, 0},
    {"AVSyncDelay", 5, 22, &MkvContext::AVSyncDelay, 0},
    {"CurrentAudioTrack", 5, 22, &MkvContext::CurrentAudioTrack, 0},
    {"tricktime", 700, 4032, &MkvContext::TrickTime, 500},
    {"TrickTime ", 700, 4032, &MkvContext::TrickTime, 500}, {"Volume", 1, 4032, nullptr, 0},
};

TEST_F(ResourcesTest, SetResourceAnswersAndStoresPerRow) {
  for (const SetCase& c : kSetCases) {
    SCOPED_TRACE(std::string(c.name) + " = " + std::to_string(c.value));
    context_->Duration = 42;
    EXPECT_EQ(Set(c.name, c.value), c.result);
    EXPECT_TRUE(!c.read_back || context_->*c.read_back == c.stored) << "not stored as " << c.stored;
    EXPECT_EQ(context_->Duration, 42u);
    context_->TrickTime = 500;
    context_->TrickPlaySkipStartSpeed = 0;
    context_->EnablePreroll = 0;
  }
  int32_t value = 800;
  EXPECT_EQ(Ops().SetResource(nullptr, "TrickTime", &value), 22);
  EXPECT_EQ(Ops().SetResource(handle_, nullptr, &value), 22);
  EXPECT_EQ(Ops().SetResource(handle_, "TrickTime", nullptr), 22);
  EXPECT_EQ(Ops().GetResources(nullptr), nullptr);
  handle_->Kind = 4;  // not a filter
  EXPECT_EQ(Set("TrickTime", 800), 22);
  EXPECT_EQ(Ops().GetResources(handle_), nullptr);
  handle_->Kind = 2;
  EXPECT_EQ(context_->TrickTime, 500);
}

TEST_F(ResourcesTest, EventProducerListsEvent4AndIgnoresRegistration) {
  const auto& events = *HostPlugin().Get<MmfEventProducerOps>("MediaEventProducer");
  uint32_t event = 0, iterator = 0;
  EXPECT_EQ(events.EventList(handle_, &event, &iterator), 0);
  EXPECT_EQ(event, 4u);
  EXPECT_EQ(iterator, 1u);
  event = 99;
  EXPECT_EQ(events.EventList(handle_, &event, &iterator), -1);
  iterator = 7;
  EXPECT_EQ(events.EventList(handle_, &event, &iterator), -1);
  EXPECT_EQ(event, 99u);
  EXPECT_EQ(events.EventList(handle_, nullptr, &iterator), 22);
  EXPECT_EQ(events.EventList(handle_, &event, nullptr), 22);
  EXPECT_EQ(events.EventRegister(handle_, 4, nullptr), 0);
  EXPECT_EQ(HostPlugin().Get<MmfSetInputPositionOps>("MediaSetInputPosition")->SetInputPosition(handle_, 12345), 0);
}

}  // namespace
