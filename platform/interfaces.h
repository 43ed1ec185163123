#pragma once
// The add-on interface table and the filter's function tables. A plug-in
// exports one array of rows, `interfaces`, ended by a row of zeros; each row
// names a table of operations. Slot order is fixed by the framework; a null
// slot is an operation the plug-in does not offer.

#include <stdint.h>

#include "platform/channel.h"
#include "platform/filter_handle.h"
#include "platform/input_stream.h"
#include "platform/media_buffer.h"
#include "platform/media_format.h"
#include "platform/memory_pool.h"
#include "platform/metadata.h"
#include "platform/read_list.h"
#include "platform/resources.h"

#ifdef __cplusplus
extern "C" {
#endif

typedef struct AoInterface {
  const char* Name;
  int32_t Version;
  const void* Interface;
} AoInterface;

// The name of the exported table.
#define AO_INTERFACES_SYMBOL "interfaces"

typedef struct MmfMediaFilterOps {
  MmfFilterHandle* (*Create)(void);
  int (*Destroy)(MmfFilterHandle* filter);
} MmfMediaFilterOps;

typedef struct MmfMediaOutputOps MmfMediaOutputOps;

typedef struct MmfMediaInputOps {
  void* Reserved0;
  void* Reserved1;
  void* Reserved2;
  // request 0 asks only whether the stream is already accepted; claim is the framework's word.
  int (*RateInputFormat)(MmfChannel* input, MmfMediaFormat* format, uint32_t request, uint32_t* claim);
  int (*SetInputFormat)(MmfChannel* input, const MmfMediaFormat* format);
  int (*SetMediaOutput)(MmfChannel* input, const MmfMediaOutputOps* upstream);
  int (*SetInputChannelMemoryPool)(MmfChannel* input, const MmfMemoryPoolOps* pool, MmfMemoryPool* param);
} MmfMediaInputOps;

struct MmfMediaOutputOps {
  MmfChannel* (*IterateOutputChannels)(MmfFilterHandle* filter, int32_t* iterator);
  int (*AcquireOutputChannel)(MmfChannel* output);
  int (*ReleaseOutputChannel)(MmfChannel* output);
  int (*IterateOutputFormats)(MmfChannel* output, MmfMediaFormat* format, int32_t* iterator);
  int (*VerifyOutputFormat)(MmfChannel* output, const MmfMediaFormat* a, const MmfMediaFormat* b);
  int (*SetOutputFormat)(MmfChannel* output, const MmfMediaFormat* format);
  // 256 and a media buffer; anything else ends or interrupts the stream.
  int (*NextBuffer)(MmfChannel* output, MmfMra** buffer);
  int (*SetOutputChannelMemoryPool)(MmfChannel* output, const MmfMemoryPoolOps* pool, MmfMemoryPool* param);
};

typedef struct MmfMediaFlushOps {
  int (*Flush)(MmfFilterHandle* filter);
} MmfMediaFlushOps;

typedef struct MmfTimeConverterOps {
  int (*ConvertToPosition)(MmfFilterHandle* filter, uint32_t unused, uint64_t time, uint64_t* position);
  int (*ConvertToTime)(MmfFilterHandle* filter, uint32_t unused, uint64_t position, uint64_t* time);
} MmfTimeConverterOps;

typedef struct MmfSeekerOps {
  int (*SeekQuery)(MmfFilterHandle* filter);
  int (*Seek)(MmfFilterHandle* filter, uint32_t unused, uint64_t time, uint64_t position);
} MmfSeekerOps;

typedef struct AoStreamInspectorOps {
  int (*SniffStream)(MmfInputStream* stream);
} AoStreamInspectorOps;

typedef struct AoResourceAccessOps {
  AoResource* (*GetResources)(MmfFilterHandle* filter);
  int (*SetResource)(MmfFilterHandle* filter, const char* name, const void* value);
} AoResourceAccessOps;

typedef struct MmfMediaControlOps {
  int (*Start)(MmfFilterHandle* filter);
  int (*Stop)(MmfFilterHandle* filter);
  int (*Pause)(MmfFilterHandle* filter);
  int (*Resume)(MmfFilterHandle* filter);
  int (*Status)(MmfFilterHandle* filter);
} MmfMediaControlOps;

// Called as post(handle, event id, data, length of the data).
typedef void (*MmfEventPost)(MmfFilterHandle* filter, uint32_t event, const void* data, uint32_t length);

typedef struct MmfEventProducerOps {
  int (*EventList)(MmfFilterHandle* filter, uint32_t* event, uint32_t* iterator);
  void (*EventSetPostFunction)(MmfFilterHandle* filter, MmfEventPost post);
  int (*EventRegister)(MmfFilterHandle* filter, uint32_t event, void* argument);
} MmfEventProducerOps;

typedef struct MmfSetInputPositionOps {
  int (*SetInputPosition)(MmfFilterHandle* filter, uint64_t position);
} MmfSetInputPositionOps;

typedef struct MmfTrickPlayOps {
  int (*TrickQuery)(MmfFilterHandle* filter);
  int (*ScanForward)(MmfFilterHandle* filter, uint32_t speed);
  int (*ScanBackward)(MmfFilterHandle* filter, uint32_t speed);
  int (*ScanEnd)(MmfFilterHandle* filter);
} MmfTrickPlayOps;

typedef struct MmfListMakerOps {
  // Called by the streamer in list mode with the entry it has just used.
  int (*GetNextReadList)(MmfChannel* input, MmfReadListEntry** entry, MmfReadListEntry* previous);
} MmfListMakerOps;

typedef struct MmfMetadataParserOps {
  int (*Parser_ParseMetadata)(MmfInputStream* stream, uint32_t unused, MmfMetadata** metadata);
  int (*Parser_GetMetadata)(MmfFilterHandle* filter, MmfMetadata** metadata);
  void (*Parser_FreeMetadata)(MmfMetadata* metadata);
  int (*Parser_QueryMetadata)(MmfMetadata* metadata, const char* key, uint32_t occurrence, MmfMetadataValue* value);
  int (*Parser_IterateMetadata)(MmfMetadata* metadata, int32_t* index, char** key, MmfMetadataValue* value);
} MmfMetadataParserOps;

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<AoInterface> && std::is_trivially_copyable_v<AoInterface>);
static_assert(sizeof(AoInterface) == 3 * sizeof(void*));
static_assert(sizeof(MmfMediaInputOps) == 7 * sizeof(void*));
static_assert(sizeof(MmfMediaOutputOps) == 8 * sizeof(void*));
static_assert(__builtin_offsetof(MmfMediaOutputOps, NextBuffer) == 6 * sizeof(void*));
static_assert(sizeof(MmfMetadataParserOps) == 5 * sizeof(void*));
#endif
