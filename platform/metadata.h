#pragma once
// Metadata blocks as the framework sees them: opaque lists read by key or by
// index through the "MediaMetadataParser" interface.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct MmfMetadata MmfMetadata;

// Value types: four characters, the first in the most significant byte.
enum {
  kMmfMetadataUtf8 = 0x55544638,  // "UTF8": text, not NUL-terminated
  kMmfMetadataNum4 = 0x4E554D34,  // "NUM4": 4 bytes in machine order
  kMmfMetadataNum8 = 0x4E554D38,  // "NUM8": 8 bytes in machine order
};

// One value as the query and iteration operations hand it out. The bytes
// belong to the block. Data holds the address; on 32-bit its upper half is 0.
typedef struct MmfMetadataValue {
  uint32_t Type;
  uint32_t Reserved;  // not written
  int64_t Size;
  uint64_t Data;
} MmfMetadataValue;

static inline const void* MmfMetadataData(const MmfMetadataValue* value) {
  return (const void*)(uintptr_t)value->Data;
}

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfMetadataValue> && std::is_trivially_copyable_v<MmfMetadataValue>);
static_assert(__builtin_offsetof(MmfMetadataValue, Size) == 8 && __builtin_offsetof(MmfMetadataValue, Data) == 16 &&
              sizeof(MmfMetadataValue) == 24);
#endif
