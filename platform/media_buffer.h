#pragma once
// The framework's media buffers (MRAs): a numbered list of elements, each a
// property element (a type with a 48-bit value) or a buffer element (a
// reference to bytes held by a pool buffer). A buffer element keeps its pool
// buffer alive: the bytes stay valid while any media buffer refers to them, so
// an output media buffer may point into an input buffer that the filter has
// already given back.

#include <stdint.h>

#include "platform/memory_pool.h"

#ifdef __cplusplus
extern "C" {
#endif

// The framework's part of a media buffer; the framework keeps more behind it.
typedef struct MmfMra {
  uint32_t Capacity;      // elements the media buffer can hold
  uint32_t ElementCount;  // elements set so far (indexes 0 .. ElementCount - 1)
} MmfMra;

typedef struct MmfMraPool MmfMraPool;

// Element kinds.
enum {
  kMmfElementBuffer = 1,
  kMmfElementProperty = 2,
};

// Property types.
enum {
  kMmfPropTimeMarker = 3,     // input: media time the input continues from; output: a block's time
  kMmfPropFramePart = 7,      // 32-bit size: the next buffer element is a piece of a longer frame
  kMmfPropFrameEnd = 8,       // the next buffer element is the last piece of that frame
  kMmfPropFileOffset = 9,     // file offset of the next buffer element
  kMmfPropVideoTime = 14,     // presentation times in microseconds
  kMmfPropSubtitleTime = 16,
  kMmfPropConfigCount = 30,   // number of decoder-configuration packets that follow
  kMmfPropSkipMark = 37,      // data was skipped before this block
  kMmfPropAudioTime = 42,
  kMmfPropPrerollTime = 125,  // preroll target time after a seek
};

// Values are 48 bits wide: the low 32 bits and the next 16.
static inline uint64_t MmfPropertyValue(uint32_t low, uint16_t high) { return ((uint64_t)high << 32) | low; }

// Flags of MmfAcquireMra.
enum { kMmfAcquireNoWait = 1 };

// Takes a free media buffer from the pool, with no elements. Without
// kMmfAcquireNoWait it waits until one is released. 0, 22 for a null argument,
// 11 when none is free and waiting was not asked for.
int MmfAcquireMra(MmfMraPool* pool, MmfMra** mra, uint32_t flags);
// Drops every element (and the buffer references they hold) and returns the
// media buffer to its pool. 0, or 22.
int MmfReleaseMra(MmfMra* mra);

// 0 and the element's kind; nonzero when there is no element at index.
int MmfGetMraElementType(MmfMra* mra, uint32_t index, uint32_t* kind);
// 0, or nonzero when index is not a buffer element.
int MmfGetMraBufferElement(MmfMra* mra, uint32_t index, MmfPoolBuffer** handle, uint8_t** address,
                           uint32_t* size);
// 0, or nonzero when index is not a property element.
int MmfGetMraPropertyElement(MmfMra* mra, uint32_t index, uint32_t* type, uint32_t* low, uint16_t* high);

// Set the element at index, which must be at most ElementCount (an existing
// element is replaced, the next free one appended) and below Capacity.
// 0, 22 for a null argument, 28 when index is out of range. A buffer element
// must lie inside its pool buffer's bytes (else 22) and takes a reference to it.
int MmfSetMraPropertyElement(MmfMra* mra, uint32_t index, uint32_t type, uint32_t low, uint16_t high);
int MmfSetMraBufferElement(MmfMra* mra, uint32_t index, MmfPoolBuffer* handle, uint8_t* address, uint32_t size);

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<MmfMra> && sizeof(MmfMra) == 8);
#endif
