#include "filter/time_converter.h"

#include "core/status.h"
#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"

namespace {

constexpr int kSeekable = 2;
constexpr int kNotSeekable = 1;

bool HasCues(const mkv_file_info& info) { return info.parse_flags & kMetCues; }

// The first counting cue position at or after `position` in list order, and
// the time of the cue point before the one that holds it (0 before the first).
struct CueAtOrAfter {
  const mkv_cue_point* cue = nullptr;
  const mkv_cue_track_position* track_position = nullptr;
  uint64_t cue_time = 0;
  uint64_t previous_time = 0;
};

CueAtOrAfter FindCueAtOrAfter(const MkvFilter* filter, uint64_t position) {
  const mkv_file_info& info = filter->Context->FileInfo;
  CueAtOrAfter result;
  const mkv_queue_node* cue_node = info.cue_points.head;
  for (uint32_t i = 0; i < info.cue_points.count; ++i, cue_node = cue_node->next) {
    const auto& cue = *static_cast<const mkv_cue_point*>(cue_node->data);
    const uint64_t time = CueTimeMicroseconds(info, cue);
    const mkv_queue_node* node = cue.track_positions.head;
    for (uint32_t j = 0; j < cue.track_positions.count; ++j, node = node->next) {
      const auto& candidate = *static_cast<const mkv_cue_track_position*>(node->data);
      if (!CuePositionCounts(filter, candidate)) continue;
      if (static_cast<int64_t>(CueBytePosition(info, candidate)) >= static_cast<int64_t>(position)) {
        result.cue = &cue;
        result.track_position = &candidate;
        result.cue_time = time;
        return result;
      }
    }
    result.previous_time = time;
  }
  return CueAtOrAfter{};
}

}  // namespace

int ConvertToPosition(MkvFilter* filter, uint64_t time, uint64_t* position) {
  MkvContext* context = filter->Context;
  context->LastPositionTime = time;
  uint64_t cue_time = time;
  if (GetCueingPosition(filter, &cue_time, 0, position) == kStatusOk) return kMmfOk;
  if (time == 0) {
    *position = context->FileInfo.first_cluster_position;
    return kMmfOk;
  }
  return kMmfNoConversion;
}

int ConvertToTime(MkvFilter* filter, uint64_t position, uint64_t* time) {
  MkvContext* context = filter->Context;
  if (context->LastPositionTime != 0 && context->EnablePreroll != 0) {
    *time = context->LastPositionTime;
    context->LastPositionTime = 0;
    return kMmfOk;
  }
  *time = 0;
  const mkv_file_info& info = context->FileInfo;
  if (!HasCues(info)) {
    AoLog(kAoLogNotice, "kelvane: ConvertToTime() no cueing data.");
    return position == info.first_cluster_position ? kMmfOk : kMmfNoConversion;
  }
  if (!(context->CueTableFlags & kCueTableValidated)) ValidateCueingTable(filter);
  CueAtOrAfter at = FindCueAtOrAfter(filter, position);
  if (at.cue) *time = CueBytePosition(info, *at.track_position) == position ? at.cue_time : at.previous_time;
  return kMmfOk;
}

int SeekQuery(const MkvFilter* filter) { return filter->Context->Seekable ? kSeekable : kNotSeekable; }

int Seek(MkvFilter* filter, uint64_t time, uint64_t position) {
  MkvContext* context = filter->Context;
  if (context->EnablePreroll != 0) {
    for (int32_t i = 0; i < context->OutputChannelCount; ++i) {
      MkvChannel& channel = filter->OutputChannels[i];
      if (!channel.State || !channel.State->Acquired || !(channel.Flags & kChannelAcquired)) continue;
      channel.State->PrerollTime = time;
      channel.State->PrerollPending = 1;
    }
  }
  const mkv_file_info& info = context->FileInfo;
  if (!HasCues(info) || info.cue_points.count == 0) return kMmfOk;
  CueAtOrAfter at = FindCueAtOrAfter(filter, position);
  if (at.cue && at.track_position->cue_codec_state != 0) {
    AoLog(kAoLogNotice, "kelvane: Non-zero codec state on cue = %lld",
          static_cast<long long>(at.track_position->cue_codec_state));
  }
  return kMmfOk;
}
