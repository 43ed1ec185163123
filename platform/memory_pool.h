#pragma once
// The framework's memory pools: fixed-size buffers handed out through a table
// of operations. A pool buffer is reference counted: acquiring gives the
// caller one reference, every media-buffer element that refers to it holds
// another, and the buffer goes back to its pool when the last one is dropped.
//
// The table serves two kinds of user. A producer that writes into a buffer
// through the CPU maps it once after acquiring (entry 4) and gives it back
// with entry 5; a user that only passes the buffer on gives it back with
// entry 6. In our framework mapping only marks the buffer, and entries 5 and
// 6 both drop the caller's reference.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct MmfMemoryPool MmfMemoryPool;

// The framework's part of a pool buffer; the framework keeps more behind it.
typedef struct MmfPoolBuffer {
  MmfMemoryPool* Pool;  // owning pool
  uint8_t* Data;        // the buffer's bytes
  uint32_t Size;        // bytes at Data
  uint32_t Reserved;
} MmfPoolBuffer;

typedef struct MmfMemoryPoolOps {
  uint32_t (*BufferSize)(MmfMemoryPool* pool);        // 0: bytes per buffer
  uint32_t (*BufferCount)(MmfMemoryPool* pool);       // 1: buffers in the pool
  uint32_t (*FreeCount)(MmfMemoryPool* pool);         // 2: buffers not in use
  // 3: 0 and a buffer holding one reference for the caller; 11 when none is
  // free (flags 0: do not wait), 22 for a null argument.
  int (*AcquireBuffer)(MmfMemoryPool* pool, MmfPoolBuffer** buffer, uint32_t flags);
  int (*MapBuffer)(MmfPoolBuffer* buffer);            // 4: before the CPU writes into it; 0
  int (*ReleaseMappedBuffer)(MmfPoolBuffer* buffer);  // 5: gives back a mapped buffer; 0
  int (*ReleaseBuffer)(MmfPoolBuffer* buffer);        // 6: gives back a buffer; 0
} MmfMemoryPoolOps;

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfPoolBuffer> && std::is_trivially_copyable_v<MmfPoolBuffer>);
static_assert(__builtin_offsetof(MmfPoolBuffer, Data) == sizeof(void*), "data address is the second field");
static_assert(__builtin_offsetof(MmfPoolBuffer, Size) == 2 * sizeof(void*), "size is the third field");
static_assert(__builtin_offsetof(MmfMemoryPoolOps, AcquireBuffer) == 3 * sizeof(void*));
static_assert(__builtin_offsetof(MmfMemoryPoolOps, MapBuffer) == 4 * sizeof(void*));
static_assert(__builtin_offsetof(MmfMemoryPoolOps, ReleaseMappedBuffer) == 5 * sizeof(void*));
static_assert(__builtin_offsetof(MmfMemoryPoolOps, ReleaseBuffer) == 6 * sizeof(void*));
#endif
