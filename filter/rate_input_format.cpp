#include <cstring>

#include "core/codec_table.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/status.h"
#include "filter/instance.h"
#include "filter/mkv_context.h"
#include "filter/rating.h"
#include "filter/track_setup.h"
#include "platform/ao_log.h"
#include "platform/graph.h"
#include "platform/mmf_status.h"
#include "stream/mkvvstream.h"

namespace {

constexpr int64_t kInputSeekFailed = -1;
constexpr uint32_t kNoSeekTest = 1;
constexpr uint32_t kLargeBufferDataRate = 50000;
constexpr int64_t kLargeBuffer = 480;
constexpr int64_t kSmallBuffer = 240;
constexpr uint32_t kOwnedCompleteMetadata = kMetadataFromCompleteParse | kMetadataOwnedByInstance;

bool SeekInput(const MmfInputStream* stream, uint64_t offset) {
  return stream->Ops && stream->Ops->Seek && stream->Ops->Seek(stream->Handle, offset, 0) != kInputSeekFailed;
}

// A full request that failed leaves what it made with the instance; a later
// one starts from a clean slate rather than parsing over it.
void DiscardEarlierAttempt(MkvFilter* filter) {
  MkvContext* context = filter->Context;
  FreeOutputChannels(filter);
  if (context->Metadata) FreeMetadata(context->Metadata);
  context->Metadata = nullptr;
  mem_free(context->Ring);
  context->Ring = nullptr;
  context->RingSize = 0;
  destroy_mkv_file_info(&context->FileInfo);
  std::memset(&context->FileInfo, 0, sizeof context->FileInfo);
  context->ExtraBufferCount = 0;
  context->CueTableFlags = 0;
  context->ByteRate = 0;
  context->Duration = 0;
}

// Runs the header parse over a virtual stream that lives only for this call.
bool ParseHeaders(MkvContext* context, const MmfInputStream* stream, const MmfMediaFormat& format) {
  mkvvstream vstream;
  std::memset(&vstream, 0, sizeof vstream);
  int64_t buffer = format.data_rate > kLargeBufferDataRate ? kLargeBuffer : kSmallBuffer;
  if (mkvvstream_init(&vstream, stream, buffer, 1, kFillWithRead, context->Seekable) != 0) return false;

  context->Metadata = mem_new_zeroed<mkv_metadata_list>();
  if (!context->Metadata) {
    mkvvstream_destroy(&vstream);
    return false;
  }
  mkv_parse_limits limits{kDefaultMaxStringSize, context->Seekable};
  mkv_file_info& info = context->FileInfo;
  info.parse_limits = &limits;
  info.metadata = context->Metadata;
  int result = parse_mkvfile(&info, &vstream);
  info.parse_limits = nullptr;  // the record dies with this call
  mkvvstream_destroy(&vstream);
  if (result != kParseSucceeded) {
    AoLog(kAoLogFailure, "Error %d while parsing file.", result);
    return false;
  }
  return true;
}

int32_t CountSupportedTracks(const mkv_file_info& info) {
  int32_t count = 0;
  for (uint32_t i = 0; i < info.track_count && i < kMaxTracks; ++i) {
    if (!info.tracks[i].codec_id) continue;
    for (const mkv_codec_row& row : supported_codec_id) {
      if (std::strcmp(row.codec_id, info.tracks[i].codec_id) == 0) ++count;
    }
  }
  return count;
}

bool MakeOutputChannels(MkvFilter* filter, const MmfMediaFormat& format) {
  MkvContext* context = filter->Context;
  const int32_t count = context->OutputChannelCount;
  filter->OutputChannels = static_cast<MkvChannel*>(mem_alloc_zeroed(sizeof(MkvChannel) * static_cast<size_t>(count)));
  if (!filter->OutputChannels) return false;
  for (int32_t k = 0; k < count; ++k) {
    MkvChannel& channel = filter->OutputChannels[k];
    channel.State = mem_new_zeroed<MkvChannelState>();
    if (!channel.State) return false;
    channel.Kind = kMmfChannelKind;
    channel.Filter = filter;
    channel.Direction = kMmfDirectionOutput;
  }
  // A track counted above but not set up (an encrypted one) leaves a record
  // without a track; the records after the set-up ones note those tracks in order.
  uint32_t left_out[kMaxTracks];
  int32_t left_out_count = 0;
  int32_t k = 0;
  const mkv_file_info& info = context->FileInfo;
  for (uint32_t i = 0; i < info.track_count && i < kMaxTracks && k < count; ++i) {
    TrackSetup setup = SetUpTrackChannel(filter, format, i, &filter->OutputChannels[k]);
    if (setup == TrackSetup::kNoMemory) return false;
    if (setup == TrackSetup::kSetUp) ++k;
    if (setup == TrackSetup::kSkipped && lookup_codec_fourcc(info.tracks[i].codec_id) != 0) {
      left_out[left_out_count++] = i;
    }
  }
  for (int32_t j = 0; j < left_out_count && k + j < count; ++j) {
    filter->OutputChannels[k + j].State->LeftOutTrack = left_out[j] + 1;
  }
  return true;
}

}  // namespace

int RateInputFormat(MkvChannel* input, const MmfMediaFormat* format, uint32_t request, uint32_t* claim) {
  if (!input || !input->Filter) return kRatingRefused;
  MkvFilter* filter = input->Filter;
  MkvContext* context = filter->Context;
  if (request == 0) return context->Rated == 1 ? kRatingAccepted : kRatingRefused;

  if (!claim || *claim != 0) return kRatingRefused;
  *claim = 1;
  if (!format || context->Rated != 0) return kRatingRefused;

  MmfInputStream* stream = nullptr;
  if (MmfGetInputStream(AsFrameworkChannel(input), &stream) != 0 || !stream) return kRatingRefused;
  // A fresh context is all zero already: clearing its large file model again costs for nothing.
  if (context->RatingTried) DiscardEarlierAttempt(filter);
  context->RatingTried = 1;

  context->Seekable = 0;
  if (format->no_seek_test != kNoSeekTest) {
    if (!SeekInput(stream, 0)) return kRatingRefused;
    context->Seekable = 1;
  }
  StoreControlState(context, kControlStopped);
  if (!ParseHeaders(context, stream, *format)) return kRatingRefused;

  uint32_t graph_flags = 0;
  if (MmfGetGraphParams(filter->Graph, &graph_flags) == 0 && (graph_flags & kMmfGraphMetadataFromStream)) {
    context->Metadata->source_stream = stream;
    context->Metadata->owner_flags = kOwnedCompleteMetadata;
  }

  const mkv_file_info& info = context->FileInfo;
  context->MicrosecondsPerTick = info.timecode_scale / 1000;
  if (info.track_count == 0) return kRatingRefused;
  context->OutputChannelCount = CountSupportedTracks(info);
  if (context->OutputChannelCount == 0) return kRatingRefused;
  if (!MakeOutputChannels(filter, *format)) return kRatingRefused;

  context->RingSize = kRingSlots;
  context->Ring = static_cast<RingSlot*>(mem_alloc_zeroed(sizeof(RingSlot) * kRingSlots));
  if (!context->Ring) return kRatingRefused;

  CalcOverallByteRate(filter);
  if (context->Seekable && !SeekInput(stream, info.first_cluster_position)) {
    AoLog(kAoLogFailure, "kelvane: Seek to first cluster failed.");
    return kRatingRefused;
  }
  context->Rated = 1;
  return kRatingAccepted;
}
