#include "filter/cue_search.h"

#include "core/status.h"
#include "filter/mkv_context.h"
#include "platform/ao_log.h"

namespace {

const mkv_cue_point& Cue(const mkv_queue_node* node) { return *static_cast<const mkv_cue_point*>(node->data); }
const mkv_cue_track_position& Position(const mkv_queue_node* node) {
  return *static_cast<const mkv_cue_track_position*>(node->data);
}

bool NamesAcquiredChannel(const MkvFilter* filter, uint64_t track) {
  const MkvContext* context = filter->Context;
  for (int32_t i = 0; i < context->OutputChannelCount; ++i) {
    const MkvChannelState* state = filter->OutputChannels[i].State;
    if (state && state->Acquired && state->Track && state->Track->track_number == track) return true;
  }
  return false;
}

}  // namespace

void ValidateCueingTable(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  context->CueTableFlags |= kCueTableValidated;
  const mkv_queue& cues = context->FileInfo.cue_points;
  const mkv_queue_node* cue = cues.head;
  for (uint32_t i = 0; i < cues.count; ++i, cue = cue->next) {
    const mkv_queue& positions = Cue(cue).track_positions;
    const mkv_queue_node* node = positions.head;
    for (uint32_t j = 0; j < positions.count; ++j, node = node->next) {
      if (NamesAcquiredChannel(filter, Position(node).cue_track)) return;
    }
  }
  context->CueTableFlags |= kCueTableAllTracksCount;
}

uint64_t CueTimeMicroseconds(const mkv_file_info& info, const mkv_cue_point& cue) {
  return cue.cue_time * (info.timecode_scale / 1000);
}

bool CuePositionCounts(const MkvFilter* filter, const mkv_cue_track_position& position) {
  const MkvContext* context = filter->Context;
  for (int32_t i = 0; i < context->OutputChannelCount; ++i) {
    const MkvChannelState* state = filter->OutputChannels[i].State;
    if (!state || !state->Track || state->Track->track_number != position.cue_track) continue;
    return state->Acquired || (context->CueTableFlags & kCueTableAllTracksCount);
  }
  return false;
}

int GetCueingPosition(MkvFilter* filter, uint64_t* time, uint32_t forward, uint64_t* position) {
  MkvContext* context = filter->Context;
  const mkv_file_info& info = context->FileInfo;
  if (!(info.parse_flags & kMetCues)) {
    AoLog(kAoLogNotice, "kelvane: %s no cueing data.", "GetCueingPosition");
    return kStatusMalformed;
  }
  *position = kNoCuePosition;
  if (!(context->CueTableFlags & kCueTableValidated)) ValidateCueingTable(filter);
  const mkv_queue& cues = info.cue_points;
  if (cues.count == 0) return kStatusOk;

  // F: the first cue point later than the time, else the last; E: the one before F.
  const auto target = static_cast<int64_t>(*time);
  const mkv_queue_node* earlier = nullptr;
  const mkv_queue_node* found = cues.head;
  uint32_t index = 0;
  for (; index + 1 < cues.count; ++index) {
    if (static_cast<int64_t>(CueTimeMicroseconds(info, Cue(found))) > target) break;
    earlier = found;
    found = found->next;
  }
  const bool found_is_last = index + 1 == cues.count;
  const mkv_queue_node* before = earlier ? earlier : found;

  const mkv_queue_node* chosen = found;
  if (!forward) {
    bool later_than_last = target > static_cast<int64_t>(CueTimeMicroseconds(info, Cue(found)));
    chosen = found_is_last && later_than_last ? found : before;
  }
  *time = CueTimeMicroseconds(info, Cue(chosen));

  const mkv_queue& positions = Cue(chosen).track_positions;
  const mkv_queue_node* node = positions.head;
  for (uint32_t j = 0; j < positions.count; ++j, node = node->next) {
    const mkv_cue_track_position& candidate = Position(node);
    if (!CuePositionCounts(filter, candidate)) continue;
    uint64_t bytes = CueBytePosition(info, candidate);
    if (static_cast<int64_t>(bytes) < static_cast<int64_t>(*position)) *position = bytes;
  }
  return kStatusOk;
}
