// One block's elements: markers, the timestamp, then each frame as a buffer
// element into inbuff1; a frame cut by the end of inbuff1 goes out in pieces.

#include "filter/output_assembly.h"
#include "filter/output_elements.h"
#include "platform/ao_log.h"

namespace {

constexpr uint64_t kTrackVideo = 1;
constexpr uint64_t kTrackAudio = 2;
constexpr uint64_t kTrackSubtitle = 17;

uint32_t TimestampType(uint64_t track_type) {
  switch (track_type) {
    case kTrackAudio:
      return kMmfPropAudioTime;
    case kTrackSubtitle:
      return kMmfPropSubtitleTime;
    case kTrackVideo:
      return kMmfPropVideoTime;
    default:
      AoLog(kAoLogDegraded, "kelvane:  Unsupported channel type.");
      return kMmfPropAudioTime;
  }
}

// Microseconds: (Cluster Timecode + block timecode) × (TimecodeScale / 1000).
uint64_t BlockTime(const MkvChannelState* state, const MkvContext* context) {
  const mkvcluster& c = state->Cluster;
  uint64_t ticks = c.cluster_timecode + static_cast<uint64_t>(static_cast<int64_t>(c.block_timecode));
  return ticks * context->MicrosecondsPerTick;
}

// The block's last frame went out: bytes after it (a fixed-size lace that does
// not divide) are passed over.
void FinishBlock(MkvChannelState* state) {
  state->FrameIndex = 0;
  state->BlockActive = 0;
  const mkvinbuff& in = state->inbuff1;
  uint64_t position = in.buff_fileoff + in.buff_pos;
  if (position < state->Cluster.block_end) {
    state->SkipBytes = state->Cluster.block_end - position;
    ApplySkip(state);
  }
}

int FrameFailed(MkvChannelState* state, int line, int error, uint32_t size, bool buffer_element) {
  if (buffer_element) {
    AoLog(kAoLogFailure,
          "kelvane line %d MmfSetMraBufferElement() failed err = %d index = %d, max index = %d, out_size = %d", line,
          error, static_cast<int>(state->OutIndex), static_cast<int>(state->OutMra->Capacity), static_cast<int>(size));
  } else {
    AoLog(kAoLogFailure, "kelvane line %d MmfSetMraPropertyElement() failed err = %d index = %d", line, error,
          static_cast<int>(state->OutIndex));
  }
  return error;
}

// Markers and the timestamp that head the block's elements in this buffer.
int BlockHead(MkvChannelState* state, MkvContext* context, uint64_t time) {
  int result = 0;
  if (context->EnablePreroll && static_cast<int64_t>(time) < static_cast<int64_t>(state->StartTime)) {
    if ((result = SetOutProperty(state, kMmfPropTimeMarker, time)) != 0) {
      AoLog(kAoLogDegraded, "kelvane MmfSetMraPropertyElement() failed ");
      return result;
    }
  }
  if (state->SendStartTime) {
    if ((result = SetOutProperty(state, kMmfPropTimeMarker, time)) != 0) {
      AoLog(kAoLogFailure, "kelvane line %d MmfSetMraPropertyElement() failed err = %d", 1735, result);
      return result;
    }
    state->SendStartTime = 0;
  }
  if (state->SendSkipMark) {
    if ((result = SetOutProperty(state, kMmfPropSkipMark, 0)) != 0) {
      AoLog(kAoLogFailure, "kelvane line %d MmfSetMraPropertyElement() failed err = %d", 1746, result);
      return result;
    }
    state->SendSkipMark = 0;
  }
  uint32_t type = TimestampType(state->Track->track_type);
  if (state->PrerollPending) {
    state->PrerollPending = 0;
    if ((result = SetOutProperty(state, kMmfPropPrerollTime, state->PrerollTime)) != 0) {
      AoLog(kAoLogDegraded, "kelvane MmfSetMraPropertyElement() failed ");
      return result;
    }
  }
  if ((result = SetOutProperty(state, type, time)) != 0) {
    AoLog(kAoLogFailure, "kelvane MmfSetMraPropertyElement() at line %d failed with err %d for MRA %p, index %d", 1784,
          result, static_cast<void*>(state->OutMra), static_cast<int>(state->OutIndex));
  }
  return result;
}

}  // namespace

int ProcessBlock(MkvChannelState* state, MkvContext* context, uint32_t* count) {
  const uint64_t time = BlockTime(state, context);
  const auto signed_time = static_cast<int64_t>(time);
  const auto start = static_cast<int64_t>(state->StartTime);
  if (!context->EnablePreroll && signed_time < start) {
    DropBlock(state);
    return 0;
  }
  if (state->ScanMode && signed_time > start + 1000 * static_cast<int64_t>(context->TrickTime)) {
    DropBlock(state);
    return 0;
  }
  if (int result = BlockHead(state, context, time); result != 0) return result;

  mkvcluster& c = state->Cluster;
  mkvinbuff& in = state->inbuff1;
  int result = 0;
  // The caller saw room for the block's head and one frame (the reserve):
  // only the frames after the first are weighed against the room left.
  bool first = true;
  for (int32_t i = state->FrameIndex; i < c.frame_count; ++i) {
    auto size = static_cast<int32_t>(static_cast<uint32_t>(c.frame_sizes[i]));
    if (size < 1) {
      AoLog(kAoLogDegraded, "kelvane invalid sized frame:  %d", size);
      continue;
    }
    if (!first && OutputNearlyFull(state)) {
      state->FrameIndex = i;
      return 0;
    }
    first = false;
    if (state->ConfigBuffer && state->FrameSplit == 0) {
      if ((result = SetOutProperty(state, kMmfPropFramePart, state->ConfigBufferSize)) != 0) {
        return FrameFailed(state, 1802, result, 0, false);
      }
      if ((result = SetOutBuffer(state, state->ConfigBuffer, state->ConfigBuffer->Data, state->ConfigBufferSize)) !=
          0) {
        return FrameFailed(state, 1811, result, static_cast<uint32_t>(size), true);
      }
      ++*count;
    }
    bool split = false;
    if (static_cast<uint32_t>(size) <= in.buff_left) {
      if (state->FrameSplit == 1) {
        if ((result = SetOutProperty(state, kMmfPropFrameEnd, 0)) != 0) return FrameFailed(state, 1834, result, 0, false);
        state->FrameSplit = 0;
      } else if (state->ConfigBuffer) {
        if ((result = SetOutProperty(state, kMmfPropFrameEnd, 0)) != 0) return FrameFailed(state, 1844, result, 0, false);
      }
    } else {
      if ((result = SetOutProperty(state, kMmfPropFramePart, in.buff_left)) != 0) {
        return FrameFailed(state, 1823, result, 0, false);
      }
      state->FrameSplit = 1;
      size = static_cast<int32_t>(in.buff_left);
      split = true;
    }
    if ((result = SetOutBuffer(state, state->ReadHandle, in.buff + in.buff_pos, static_cast<uint32_t>(size))) != 0) {
      return FrameFailed(state, 1857, result, static_cast<uint32_t>(size), true);
    }
    ++*count;
    if (split) {
      c.frame_sizes[i] -= size;
      in.buff_pos += in.buff_left;
      in.buff_left = 0;
      state->FrameIndex = i;
      return 0;
    }
    in.buff_pos += static_cast<uint32_t>(size);
    in.buff_left -= static_cast<uint32_t>(size);
    if (in.buff_left == 0) {
      if (i + 1 < c.frame_count) {
        state->FrameIndex = i + 1;
        return 0;
      }
      break;
    }
  }
  FinishBlock(state);
  return 0;
}
