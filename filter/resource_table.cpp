#include "filter/resource_table.h"

#include <cstddef>
#include <cstring>

#include "core/memory.h"
#include "filter/mkv_context.h"
#include "platform/mmf_status.h"

namespace {

constexpr AoResourceRange64 longlongrange = {0, 86400000000, 1};  // up to 24 hours in microseconds
constexpr AoResourceRange32 longrange = {-2147483647, 2147483647, 1};
constexpr AoResourceRange32 tricktimerange = {500, 1000, 1};

constexpr uint32_t kReadOnlyInt32 = kAoResourceListed | kAoResourceInt32;
constexpr uint32_t kSettableInt32 = kAoResourceListed | kAoResourceSettable | kAoResourceInt32;
constexpr uint32_t kReadOnlyInt64 = kAoResourceListed | kAoResourceInt64;
constexpr uint32_t kReadOnlyString = kAoResourceListed | kAoResourceString;

// The constant table: each value is named by its place in MkvContext.
struct resource_row {
  const char* name;
  const char* description;
  size_t value_offset;
  const void* range;
  uint32_t type;
};

#define CONTEXT_FIELD(field) __builtin_offsetof(MkvContext, field)

const resource_row resources[kResourceRows] = {
    {"Duration", "Duration", CONTEXT_FIELD(Duration), &longlongrange, kReadOnlyInt64},
    {"CurrentAudioTrack", "CurrentAudioTrack", CONTEXT_FIELD(CurrentAudioTrack), nullptr, kSettableInt32},
    {"TrackAudioLang", "TrackAudioLang", CONTEXT_FIELD(TrackAudioLang), nullptr, kReadOnlyString},
    {"TrackCountAudio", "TrackCountAudio", CONTEXT_FIELD(TrackCountAudio), nullptr, kReadOnlyInt32},
    {"CurrentVideoTrack", "CurrentVideoTrack", CONTEXT_FIELD(CurrentVideoTrack), nullptr, kSettableInt32},
    {"TrackVideoLang", "TrackVideoLang", CONTEXT_FIELD(TrackVideoLang), nullptr, kReadOnlyString},
    {"TrackCountVideo", "TrackCountVideo", CONTEXT_FIELD(TrackCountVideo), nullptr, kReadOnlyInt32},
    {"AVSyncDelay", "Amount of delay to add to the video", CONTEXT_FIELD(AVSyncDelay), &longrange, kSettableInt32},
    {"EnablePreroll", "Enable or disable preroll/roll forward on seek.", CONTEXT_FIELD(EnablePreroll), &longrange,
     kSettableInt32},
    {"TrickTime", "TrickTime", CONTEXT_FIELD(TrickTime), &tricktimerange, kSettableInt32},
    {"TrickPlaySkipStartSpeed", "Parser needs to send all frames to decoder during trickplay up to this speed",
     CONTEXT_FIELD(TrickPlaySkipStartSpeed), &tricktimerange, kSettableInt32},
};

#undef CONTEXT_FIELD

// Rows below this one cannot be set, whatever their type word says.
constexpr int kFirstSettableRow = 8;

int32_t Clamp(int32_t value, const AoResourceRange32* range) {
  if (!range) return value;
  if (value < range->Minimum) return range->Minimum;
  if (value > range->Maximum) return range->Maximum;
  return value;
}

}  // namespace

AoResource* MakeResourceTable(MkvContext* context) {
  auto* table = static_cast<AoResource*>(mem_alloc_zeroed(sizeof(AoResource) * (kResourceRows + 1)));
  if (!table) return nullptr;
  for (int i = 0; i < kResourceRows; ++i) {
    table[i].Name = resources[i].name;
    table[i].Description = resources[i].description;
    table[i].Value = reinterpret_cast<char*>(context) + resources[i].value_offset;
    table[i].Range = resources[i].range;
    table[i].Type = resources[i].type;
  }
  return table;
}

AoResource* GetResources(MkvFilter* filter) {
  if (filter->Kind != kMmfFilterKind) return nullptr;
  return filter->Context->Resources;
}

int SetResource(MkvFilter* filter, const char* name, const void* value) {
  if (filter->Kind != kMmfFilterKind) return kMmfInvalidArgument;
  int row = 0;
  while (row < kResourceRows && std::strcmp(resources[row].name, name) != 0) ++row;
  if (row == kResourceRows) return kMmfUnknownResource;
  if (!(resources[row].type & kAoResourceSettable)) return kMmfReadOnly;
  if (row < kFirstSettableRow || (resources[row].type & kAoResourceKindMask) != kAoResourceInt32) {
    return kMmfInvalidArgument;
  }
  if (!value) return kMmfInvalidArgument;
  int32_t wanted;
  std::memcpy(&wanted, value, sizeof wanted);
  int32_t clamped = Clamp(wanted, static_cast<const AoResourceRange32*>(resources[row].range));
  std::memcpy(filter->Context->Resources[row].Value, &clamped, sizeof clamped);
  return kMmfOk;
}
