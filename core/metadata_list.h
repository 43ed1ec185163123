#pragma once
// The metadata list offered to the media player: a flat list of key, type and
// value entries (tags and per-track stream properties), followed by a trailer
// that the metadata parser interface and its event own. The creator of a
// header parse hands in a zero-filled record; FreeMetadata frees it.

#include <cstdint>
#include <type_traits>

#include "core/file_model.h"
#include "platform/input_stream.h"

constexpr int32_t kMaxMetadataEntries = 250;
constexpr int32_t kMetadataSlots = 251;  // one slot more than is ever used
constexpr int32_t kMaxMetadataValueSize = 32768;

// Value types: four characters as a big-endian number.
constexpr uint32_t kMetadataTypeUtf8 = 0x55544638;  // "UTF8", text without a NUL
constexpr uint32_t kMetadataTypeNum4 = 0x4E554D34;  // "NUM4", 4 bytes in machine order
constexpr uint32_t kMetadataTypeNum8 = 0x4E554D38;  // "NUM8", 8 bytes in machine order

// Bits of mkv_metadata_list::owner_flags.
constexpr uint32_t kMetadataFromCompleteParse = 1u << 0;  // may be released by its caller
constexpr uint32_t kMetadataOwnedByInstance = 1u << 1;    // freed only by the instance's Destroy

struct mkv_metadata_list {
  int32_t value_size[kMetadataSlots];   // bytes of each entry's value
  uint32_t value_type[kMetadataSlots];  // kMetadataType...
  char* key[kMetadataSlots];            // owned, NUL-terminated
  void* value[kMetadataSlots];          // owned copy of value_size bytes
  int32_t entry_count;                  // entries 0 .. entry_count - 1 are used; at most 250

  // Trailer of the metadata parser interface and the event it posts.
  const MmfInputStream* source_stream;  // the stream an instance's list came from; null otherwise
  uint32_t event_posted;                // 1 once the metadata event went out
  uint8_t event_data[8];                // posted with the event; never written
  uint32_t owner_flags;
};
static_assert(std::is_standard_layout_v<mkv_metadata_list> && std::is_trivially_copyable_v<mkv_metadata_list>);
static_assert(__builtin_offsetof(mkv_metadata_list, key) == kMetadataSlots * 2 * sizeof(uint32_t));
static_assert(__builtin_offsetof(mkv_metadata_list, entry_count) ==
              kMetadataSlots * (2 * sizeof(uint32_t) + 2 * sizeof(void*)));
static_assert(__builtin_offsetof(mkv_metadata_list, event_data) ==
              __builtin_offsetof(mkv_metadata_list, event_posted) + sizeof(uint32_t));

// Appends one entry: `type` points at four characters ("UTF8"), `value` at
// `size` bytes, which are copied. 0, or 12 when the list is full, `size` is
// negative or above 32768, or a copy cannot be allocated (nothing is added then).
[[nodiscard]] int add_metadata_entry(mkv_metadata_list* list, const char* type, const char* key, const void* value,
                                     int32_t size);

// Builds the list of `info->metadata` from the tag entries and the track
// records: matching tags, "Seekable", "TrackCount", then nine entries per
// audio or video track. 0, or 12 when an entry could not be added (those added
// before stay). With no list handed in there is nothing to build: 0.
int FinalizeMetadata(mkv_file_info* info);

// Frees every entry's key and value and then the record. Null does nothing.
void FreeMetadata(mkv_metadata_list* list);
