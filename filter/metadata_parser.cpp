#include "filter/metadata_parser.h"

#include <strings.h>

#include <cstring>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/status.h"
#include "filter/mkv_context.h"
#include "platform/ao_log.h"
#include "platform/mmf_status.h"
#include "stream/mkvvstream.h"

namespace {

constexpr int64_t kMetadataBufferSize = 240;
constexpr int64_t kSeekFailed = -1;
constexpr uint32_t kMediaTypeVideoBit = 2;

bool SeekToStart(const MmfInputStream* stream) {
  if (!stream->Ops || !stream->Ops->Seek) return false;
  return stream->Ops->Seek(stream->Handle, 0, 0) != kSeekFailed;
}

void FillValue(const mkv_metadata_list* list, int32_t i, MmfMetadataValue* value) {
  value->Type = list->value_type[i];
  value->Size = list->value_size[i];
  value->Data = reinterpret_cast<uintptr_t>(list->value[i]);
}

bool KeyIs(const char* key, const char* wanted) { return key && strcasecmp(key, wanted) == 0; }

// The header parse proper, over a virtual stream that is already open.
int ParseInto(mkvvstream* vstream, const MmfInputStream* stream, mkv_metadata_list* list) {
  mkv_file_info info;
  std::memset(&info, 0, sizeof info);
  mkv_parse_limits limits{kDefaultMaxStringSize, 1};
  info.metadata = list;
  info.parse_limits = &limits;

  int result = kStatusMalformed;
  if (valid_mkv(vstream, &info) == kStatusOk && mkvvstream_seek(vstream, 0) == 0) {
    int parse = parse_mkvfile(&info, vstream);
    if (parse == kParseSucceeded) {
      result = kStatusOk;
    } else {
      AoLog(kAoLogNotice, "kelvane:  Error %d while parsing metadata for file %s.", parse,
            stream->Name ? stream->Name : "");
    }
  }
  destroy_mkv_file_info(&info);
  return result;
}

}  // namespace

int Parser_ParseMetadata(const MmfInputStream* stream, mkv_metadata_list** out) {
  if (!SeekToStart(stream)) return kMmfNoConversion;

  mkvvstream vstream;
  std::memset(&vstream, 0, sizeof vstream);
  int result = kStatusNoMemory;
  if (mkvvstream_init(&vstream, stream, kMetadataBufferSize, 1, kFillWithRead, 1) == 0) {
    auto* list = mem_new_zeroed<mkv_metadata_list>();
    if (list) {
      result = ParseInto(&vstream, stream, list);
      if (result == kStatusOk) {
        list->owner_flags = kMetadataFromCompleteParse;
        *out = list;
      } else {
        FreeMetadata(list);
      }
    }
    mkvvstream_destroy(&vstream);
  }
  (void)SeekToStart(stream);
  return result;
}

int Parser_GetMetadata(MkvFilter* filter, mkv_metadata_list** out) {
  mkv_metadata_list* list = filter->Context ? filter->Context->Metadata : nullptr;
  if (!list) return kMmfNotAvailable;
  *out = list;
  return kMmfOk;
}

int Parser_IterateMetadata(const mkv_metadata_list* list, int32_t* index, char** key, MmfMetadataValue* value) {
  int32_t i = *index;
  if (i < 0 || i >= list->entry_count) return 0;
  *key = list->key[i];
  FillValue(list, i, value);
  *index = i + 1;
  return 1;
}

int Parser_QueryMetadata(const mkv_metadata_list* list, const char* key, uint32_t occurrence,
                         MmfMetadataValue* value) {
  int32_t count = list->entry_count < kMaxMetadataEntries ? list->entry_count : kMaxMetadataEntries;
  uint32_t media_type = 0;
  for (int32_t i = 0; i < count; ++i) {
    if (KeyIs(list->key[i], "MediaType") && list->value[i] && list->value_size[i] >= 4) {
      std::memcpy(&media_type, list->value[i], sizeof media_type);
    }
    if (!KeyIs(list->key[i], key)) continue;
    if (occurrence != 0) {
      --occurrence;
      continue;
    }
    if ((KeyIs(key, "width") || KeyIs(key, "height")) && !(media_type & kMediaTypeVideoBit)) return 0;
    FillValue(list, i, value);
    return 1;
  }
  return 0;
}

void Parser_FreeMetadata(mkv_metadata_list* list) {
  if (!list) return;
  if ((list->owner_flags & kMetadataFromCompleteParse) && !(list->owner_flags & kMetadataOwnedByInstance)) {
    FreeMetadata(list);
  }
}
