#pragma once
// The metadata parser interface: a stand-alone header parse that yields a
// metadata block, the instance's block, and reading blocks by index or key.
// The thin interface file has refused null arguments before these run.

#include <cstdint>

#include "core/metadata_list.h"
#include "filter/mkv_filter.h"
#include "platform/input_stream.h"
#include "platform/metadata.h"

// 0 and a new block owned by the caller (owner flags 1); 4002 when the stream
// does not seek to 0; 12 out of memory; 48 not Matroska or the parse failed.
// The stream is left at offset 0 whatever the outcome after the first seek.
[[nodiscard]] int Parser_ParseMetadata(const MmfInputStream* stream, mkv_metadata_list** out);

// 0 and the instance's block (still owned by the instance); 4044 when it has none.
[[nodiscard]] int Parser_GetMetadata(MkvFilter* filter, mkv_metadata_list** out);

// 1 with the entry at *index and *index advanced; 0 when *index is not an
// entry (negative or not below entry_count).
[[nodiscard]] int Parser_IterateMetadata(const mkv_metadata_list* list, int32_t* index, char** key,
                                         MmfMetadataValue* value);

// 1 with the occurrence-th entry (0 = first) whose key equals `key` in any
// letter case; 0 when there is none, and for "width" or "height" unless a
// "MediaType" entry with the video bit (2) comes before the match.
[[nodiscard]] int Parser_QueryMetadata(const mkv_metadata_list* list, const char* key, uint32_t occurrence,
                                       MmfMetadataValue* value);

// Frees a block from Parser_ParseMetadata; an instance's block, or one whose
// parse never completed, is left alone.
void Parser_FreeMetadata(mkv_metadata_list* list);
