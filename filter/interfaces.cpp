// The plug-in's C-linkage surface: the exported table `interfaces` and the
// function tables it lists. Each operation checks its arguments here and
// calls the C++ that implements it.

#include "filter/events.h"
#include "filter/input_channel.h"
#include "filter/instance.h"
#include "filter/media_control.h"
#include "filter/metadata_parser.h"
#include "filter/mkv_context.h"
#include "filter/output_assembly.h"
#include "filter/output_channels.h"
#include "filter/rating.h"
#include "filter/read_list.h"
#include "filter/resource_table.h"
#include "filter/ring_buffer.h"
#include "filter/time_converter.h"
#include "filter/trick_play.h"
#include "platform/interfaces.h"
#include "platform/mmf_status.h"

namespace {

bool IsFilter(const MmfFilterHandle* handle) { return handle && handle->Kind == kMmfFilterKind; }

// A channel record that ended its set-up without a track cannot play: 4044.
constexpr int kNoTrack = kMmfNotAvailable;
bool NoTrack(MmfChannel* channel, const char* operation) { return RefusedWithoutTrack(AsMkvChannel(channel), operation); }

// MediaFilter
MmfFilterHandle* OpCreate() { return AsFrameworkHandle(Create()); }
int OpDestroy(MmfFilterHandle* handle) { return handle ? Destroy(AsMkvFilter(handle)) : kMmfInvalidArgument; }

// MediaInput
int OpRateInputFormat(MmfChannel* channel, MmfMediaFormat* format, uint32_t request, uint32_t* claim) {
  if (NoTrack(channel, "RateInputFormat")) return kRatingRefused;
  return RateInputFormat(AsMkvChannel(channel), format, request, claim);
}
int OpSetInputFormat(MmfChannel* channel, const MmfMediaFormat* format) {
  if (NoTrack(channel, "SetInputFormat")) return kNoTrack;
  return SetInputFormat(AsMkvChannel(channel), format);
}
int OpSetMediaOutput(MmfChannel* channel, const MmfMediaOutputOps* upstream) {
  if (NoTrack(channel, "SetMediaOutput")) return kNoTrack;
  return SetMediaOutput(AsMkvChannel(channel), upstream);
}
int OpSetInputChannelMemoryPool(MmfChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param) {
  if (NoTrack(channel, "SetInputChannelMemoryPool")) return kNoTrack;
  return SetInputChannelMemoryPool(AsMkvChannel(channel), pool, param);
}

// MediaOutput
MmfChannel* OpIterateOutputChannels(MmfFilterHandle* handle, int32_t* iterator) {
  return AsFrameworkChannel(handle ? IterateOutputChannels(AsMkvFilter(handle), iterator) : nullptr);
}
int OpAcquireOutputChannel(MmfChannel* channel) {
  if (NoTrack(channel, "AcquireOutputChannel")) return kNoTrack;
  return AcquireOutputChannel(AsMkvChannel(channel));
}
int OpReleaseOutputChannel(MmfChannel* channel) {
  if (NoTrack(channel, "ReleaseOutputChannel")) return kNoTrack;
  return ReleaseOutputChannel(AsMkvChannel(channel));
}
int OpIterateOutputFormats(MmfChannel* channel, MmfMediaFormat* format, int32_t* iterator) {
  if (NoTrack(channel, "IterateOutputFormats")) return kNoTrack;
  return IterateOutputFormats(AsMkvChannel(channel), format, iterator);
}
int OpVerifyOutputFormat(MmfChannel* channel, const MmfMediaFormat* a, const MmfMediaFormat* b) {
  if (NoTrack(channel, "VerifyOutputFormat")) return 0;  // its only answer besides a match
  return VerifyOutputFormat(AsMkvChannel(channel), a, b);
}
int OpSetOutputFormat(MmfChannel* channel, const MmfMediaFormat* format) {
  if (NoTrack(channel, "SetOutputFormat")) return kNoTrack;
  return SetOutputFormat(AsMkvChannel(channel), format);
}
int OpNextBuffer(MmfChannel* channel, MmfMra** buffer) {
  if (!channel || !buffer || !channel->Filter || !channel->State) return kMmfInvalidArgument;
  if (NoTrack(channel, "NextBuffer")) {
    *buffer = nullptr;
    return kNoTrack;
  }
  return NextBuffer(AsMkvChannel(channel), buffer);
}
int OpSetOutputChannelMemoryPool(MmfChannel* channel, const MmfMemoryPoolOps* pool, MmfMemoryPool* param) {
  if (NoTrack(channel, "SetOutputChannelMemoryPool")) return kNoTrack;
  return SetOutputChannelMemoryPool(AsMkvChannel(channel), pool, param);
}

// MediaFlush
int OpFlush(MmfFilterHandle* handle) { return IsFilter(handle) ? Flush(AsMkvFilter(handle)) : kMmfInvalidArgument; }

// MediaTimeConverter
int OpConvertToPosition(MmfFilterHandle* handle, uint32_t, uint64_t time, uint64_t* position) {
  return handle && position ? ConvertToPosition(AsMkvFilter(handle), time, position) : kMmfInvalidArgument;
}
int OpConvertToTime(MmfFilterHandle* handle, uint32_t, uint64_t position, uint64_t* time) {
  return handle && time ? ConvertToTime(AsMkvFilter(handle), position, time) : kMmfInvalidArgument;
}

// MediaSeeker
int OpSeekQuery(MmfFilterHandle* handle) { return handle ? SeekQuery(AsMkvFilter(handle)) : kMmfInvalidArgument; }
int OpSeek(MmfFilterHandle* handle, uint32_t, uint64_t time, uint64_t position) {
  return handle ? Seek(AsMkvFilter(handle), time, position) : kMmfInvalidArgument;
}

// AOStreamInspector
int OpSniffStream(MmfInputStream* stream) { return stream ? SniffStream(stream) : kRatingRefused; }

// AOResourceAccess
AoResource* OpGetResources(MmfFilterHandle* handle) {
  return IsFilter(handle) ? GetResources(AsMkvFilter(handle)) : nullptr;
}
int OpSetResource(MmfFilterHandle* handle, const char* name, const void* value) {
  if (!IsFilter(handle) || !name) return kMmfInvalidArgument;
  return SetResource(AsMkvFilter(handle), name, value);
}

// MediaControl
int OpStart(MmfFilterHandle* handle) { return IsFilter(handle) ? Start(AsMkvFilter(handle)) : kMmfInvalidArgument; }
int OpStop(MmfFilterHandle* handle) { return IsFilter(handle) ? Stop(AsMkvFilter(handle)) : kMmfInvalidArgument; }
int OpPause(MmfFilterHandle* handle) { return IsFilter(handle) ? Pause(AsMkvFilter(handle)) : kMmfInvalidArgument; }
int OpResume(MmfFilterHandle* handle) { return IsFilter(handle) ? Resume(AsMkvFilter(handle)) : kMmfInvalidArgument; }
int OpStatus(MmfFilterHandle* handle) { return IsFilter(handle) ? Status(AsMkvFilter(handle)) : kMmfInvalidArgument; }

// MediaEventProducer
int OpEventList(MmfFilterHandle* handle, uint32_t* event, uint32_t* iterator) {
  if (!handle || !event || !iterator) return kMmfInvalidArgument;
  return EventList(AsMkvFilter(handle), event, iterator);
}
void OpEventSetPostFunction(MmfFilterHandle* handle, MmfEventPost post) {
  if (handle && handle->Context) EventSetPostFunction(AsMkvFilter(handle), post);
}
int OpEventRegister(MmfFilterHandle*, uint32_t, void*) { return EventRegister(); }

// MediaSetInputPosition
int OpSetInputPosition(MmfFilterHandle*, uint64_t) { return SetInputPosition(); }

// MediaTrickPlay
int OpTrickQuery(MmfFilterHandle*) { return TrickQuery(); }
int OpScanForward(MmfFilterHandle* handle, uint32_t speed) {
  return IsFilter(handle) ? ScanForward(AsMkvFilter(handle), speed) : kMmfInvalidArgument;
}
int OpScanBackward(MmfFilterHandle* handle, uint32_t speed) {
  return IsFilter(handle) ? ScanBackward(AsMkvFilter(handle), speed) : kMmfInvalidArgument;
}
int OpScanEnd(MmfFilterHandle* handle) { return IsFilter(handle) ? ScanEnd(AsMkvFilter(handle)) : kMmfInvalidArgument; }

// MediaListMaker
int OpGetNextReadList(MmfChannel* channel, MmfReadListEntry** entry, MmfReadListEntry* previous) {
  if (!channel || !entry || !channel->Filter) return kMmfInvalidArgument;
  if (NoTrack(channel, "GetNextReadList")) return kNoTrack;
  return GetNextReadList(AsMkvChannel(channel), entry, previous);
}

// MediaMetadataParser: the framework's opaque block is the core's metadata list.
mkv_metadata_list* AsList(MmfMetadata* metadata) { return reinterpret_cast<mkv_metadata_list*>(metadata); }

int OpParseMetadata(MmfInputStream* stream, uint32_t, MmfMetadata** metadata) {
  if (!stream || !metadata) return kMmfInvalidArgument;
  mkv_metadata_list* list = nullptr;
  int result = Parser_ParseMetadata(stream, &list);
  if (result == kMmfOk) *metadata = reinterpret_cast<MmfMetadata*>(list);
  return result;
}
int OpGetMetadata(MmfFilterHandle* handle, MmfMetadata** metadata) {
  if (!handle || !metadata) return kMmfInvalidArgument;
  mkv_metadata_list* list = nullptr;
  int result = Parser_GetMetadata(AsMkvFilter(handle), &list);
  if (result == kMmfOk) *metadata = reinterpret_cast<MmfMetadata*>(list);
  return result;
}
void OpFreeMetadata(MmfMetadata* metadata) { Parser_FreeMetadata(AsList(metadata)); }
int OpQueryMetadata(MmfMetadata* metadata, const char* key, uint32_t occurrence, MmfMetadataValue* value) {
  if (!metadata || !key || !value) return kMmfInvalidArgument;
  return Parser_QueryMetadata(AsList(metadata), key, occurrence, value);
}
int OpIterateMetadata(MmfMetadata* metadata, int32_t* index, char** key, MmfMetadataValue* value) {
  if (!metadata || !index || !key || !value) return kMmfInvalidArgument;
  return Parser_IterateMetadata(AsList(metadata), index, key, value);
}

constexpr MmfMediaFilterOps media_filter = {.Create = OpCreate, .Destroy = OpDestroy};

constexpr MmfMediaInputOps media_input = {
    .Reserved0 = nullptr,
    .Reserved1 = nullptr,
    .Reserved2 = nullptr,
    .RateInputFormat = OpRateInputFormat,
    .SetInputFormat = OpSetInputFormat,
    .SetMediaOutput = OpSetMediaOutput,
    .SetInputChannelMemoryPool = OpSetInputChannelMemoryPool,
};

constexpr MmfMediaOutputOps media_output = {
    .IterateOutputChannels = OpIterateOutputChannels,
    .AcquireOutputChannel = OpAcquireOutputChannel,
    .ReleaseOutputChannel = OpReleaseOutputChannel,
    .IterateOutputFormats = OpIterateOutputFormats,
    .VerifyOutputFormat = OpVerifyOutputFormat,
    .SetOutputFormat = OpSetOutputFormat,
    .NextBuffer = OpNextBuffer,
    .SetOutputChannelMemoryPool = OpSetOutputChannelMemoryPool,
};

constexpr MmfMediaFlushOps media_flush = {.Flush = OpFlush};

constexpr MmfTimeConverterOps media_timeconverter = {
    .ConvertToPosition = OpConvertToPosition,
    .ConvertToTime = OpConvertToTime,
};

constexpr MmfSeekerOps media_seeker = {.SeekQuery = OpSeekQuery, .Seek = OpSeek};

constexpr AoStreamInspectorOps stream_inspector = {.SniffStream = OpSniffStream};

constexpr AoResourceAccessOps resource_access = {.GetResources = OpGetResources, .SetResource = OpSetResource};

constexpr MmfMediaControlOps media_control = {
    .Start = OpStart,
    .Stop = OpStop,
    .Pause = OpPause,
    .Resume = OpResume,
    .Status = OpStatus,
};

constexpr MmfEventProducerOps media_event_producer = {
    .EventList = OpEventList,
    .EventSetPostFunction = OpEventSetPostFunction,
    .EventRegister = OpEventRegister,
};

constexpr MmfSetInputPositionOps media_setinput_position = {.SetInputPosition = OpSetInputPosition};

constexpr MmfTrickPlayOps media_trickplay = {
    .TrickQuery = OpTrickQuery,
    .ScanForward = OpScanForward,
    .ScanBackward = OpScanBackward,
    .ScanEnd = OpScanEnd,
};

constexpr MmfListMakerOps media_listmaker = {.GetNextReadList = OpGetNextReadList};

constexpr MmfMetadataParserOps md_parser = {
    .Parser_ParseMetadata = OpParseMetadata,
    .Parser_GetMetadata = OpGetMetadata,
    .Parser_FreeMetadata = OpFreeMetadata,
    .Parser_QueryMetadata = OpQueryMetadata,
    .Parser_IterateMetadata = OpIterateMetadata,
};

constexpr char kModuleName[] = "kelvane";

}  // namespace

extern "C" __attribute__((visibility("default"))) const AoInterface interfaces[] = {
    {"Name", 1, kModuleName},
    {"Version", 100, nullptr},
    {"MediaFilter", 110, &media_filter},
    {"MediaInput", 101, &media_input},
    {"MediaOutput", 101, &media_output},
    {"MediaFlush", 100, &media_flush},
    {"MediaTimeConverter", 100, &media_timeconverter},
    {"MediaSeeker", 102, &media_seeker},
    {"AOStreamInspector", 100, &stream_inspector},
    {"AOResourceAccess", 100, &resource_access},
    {"MediaControl", 101, &media_control},
    {"MediaEventProducer", 100, &media_event_producer},
    {"MediaSetInputPosition", 100, &media_setinput_position},
    {"MediaTrickPlay", 100, &media_trickplay},
    {"MediaListMaker", 100, &media_listmaker},
    {"MediaMetadataParser", 100, &md_parser},
    {nullptr, 0, nullptr},
};
